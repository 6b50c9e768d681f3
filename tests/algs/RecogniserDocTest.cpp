// docs/recogniser.md shows the event decision as a table; it must be the
// code's table, row for row.
#include "algs/Algs.h"
#include "platform/plugin/HidEvent.h"
#include "records/Gesture.h"

#include <gtest/gtest.h>

#include <cctype>
#include <fstream>
#include <sstream>
#include <string>
#include <vector>

namespace VeltoTouch::Test {
namespace {

std::vector<std::string> cellsOf(const std::string& row)
{
    std::vector<std::string> cells;
    std::istringstream in(row);
    std::string cell;
    std::getline(in, cell, '|');  // before the first bar
    while (std::getline(in, cell, '|')) {
        const auto first = cell.find_first_not_of(' ');
        const auto last = cell.find_last_not_of(' ');
        cells.push_back(first == std::string::npos ? "" : cell.substr(first, last - first + 1));
    }
    if (!cells.empty() && cells.back().empty()) cells.pop_back();
    return cells;
}

TEST(RecogniserDoc, EventRuleTableIsTheCodes)
{
    std::ifstream doc(std::string(VELTO_DOCS_DIR) + "/recogniser.md");
    ASSERT_TRUE(doc) << "docs/recogniser.md";
    std::vector<std::vector<std::string>> rows;
    bool inside = false;
    for (std::string line; std::getline(doc, line);) {
        if (line.find("event-rules: begin") != std::string::npos) inside = true;
        if (line.find("event-rules: end") != std::string::npos) inside = false;
        if (inside && line.starts_with("| ") && std::isdigit(static_cast<unsigned char>(line[2]))) rows.push_back(cellsOf(line));
    }
    const auto& rules = Algs::eventRules();
    ASSERT_EQ(rows.size(), rules.size()) << "rows of the event-rules table in docs/recogniser.md";
    for (std::size_t i = 0; i < rules.size(); ++i) {
        SCOPED_TRACE("row " + std::to_string(i + 1));
        ASSERT_EQ(rows[i].size(), 4u);
        EXPECT_EQ(rows[i][0], std::to_string(i + 1));
        EXPECT_EQ(rows[i][1], rules[i].name);
        // The table names each rule's event as the gesture it decodes to.
        const VeltoHost::HidEventRef event = rules[i].create(PixelRegion::Top);
        EXPECT_EQ(rows[i][2], event ? Gesture::name(Gesture::of(*event).kind) : "none");
        EXPECT_EQ(rows[i][3], rules[i].resetsTouch ? "yes" : "no");
    }
}

}  // namespace
}  // namespace VeltoTouch::Test
