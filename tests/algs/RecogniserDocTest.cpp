// docs/recogniser.md shows the event decision as a table; it must be the
// code's table, row for row.
#include "algs/Algs.h"
#include "platform/HidEvent.h"

#include <gtest/gtest.h>

#include <cctype>
#include <fstream>
#include <map>
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
    const std::map<std::string, int> phaseOf = {
        {"may-begin", VeltoHost::HidEvent::kPhaseMayBegin}, {"hold-start", VeltoHost::HidEvent::kPhaseBegan},
        {"hold-change", VeltoHost::HidEvent::kPhaseChanged}, {"hold-end", VeltoHost::HidEvent::kPhaseEnded},
        {"cancel", VeltoHost::HidEvent::kPhaseCancelled},    {"tap", 0},
        {"none", -1}};

    const auto& rules = Algs::eventRules();
    ASSERT_EQ(rows.size(), rules.size()) << "rows of the event-rules table in docs/recogniser.md";
    for (std::size_t i = 0; i < rules.size(); ++i) {
        SCOPED_TRACE("row " + std::to_string(i + 1));
        ASSERT_EQ(rows[i].size(), 4u);
        EXPECT_EQ(rows[i][0], std::to_string(i + 1));
        EXPECT_EQ(rows[i][1], rules[i].name);
        const VeltoHost::HidEventRef event = rules[i].create(PixelRegion::Top);
        ASSERT_TRUE(phaseOf.contains(rows[i][2])) << rows[i][2];
        EXPECT_EQ(event ? event->phase() : -1, phaseOf.at(rows[i][2])) << rows[i][2];
        EXPECT_EQ(rows[i][3], rules[i].resetsTouch ? "yes" : "no");
    }
}

}  // namespace
}  // namespace VeltoTouch::Test
