// Report pages of the example recordings, opened in a real (headless) browser
// and read back from the DOM the page built.
#include "HeadlessChromium.h"
#include "report/ColumnEncoder.h"
#include "tools/ToolTestSupport.h"

#include <gtest/gtest.h>

#include <cstdlib>
#include <regex>

namespace VeltoTool::Testing {
namespace {

std::vector<std::vector<std::string>> matches(const std::string& text, const std::string& pattern)
{
    std::vector<std::vector<std::string>> out;
    const std::regex expression(pattern);
    for (auto it = std::sregex_iterator(text.begin(), text.end(), expression); it != std::sregex_iterator(); ++it) {
        std::vector<std::string> groups;
        for (std::size_t group = 1; group < it->size(); ++group) groups.push_back((*it)[group].str());
        out.push_back(std::move(groups));
    }
    return out;
}

std::string unescapeHtml(std::string text)
{
    for (const auto& [from, to] : {std::pair<std::string, std::string>{"&lt;", "<"}, {"&gt;", ">"}, {"&quot;", "\""},
                                   {"&amp;", "&"}}) {
        for (std::size_t at = text.find(from); at != std::string::npos; at = text.find(from, at + to.size())) {
            text.replace(at, from.size(), to);
        }
    }
    return text;
}

// The recogniser's description of the first frame numbered `frame`, as replay --dump prints it.
std::string dumpedDescription(const std::string& dump, std::int64_t frame)
{
    const std::string header = "Frame " + std::to_string(frame) + " @";
    std::istringstream lines(dump);
    for (std::string line; std::getline(lines, line);) {
        if (line.rfind(header, 0) == 0 && line.find("*** Touch State Description ***") != std::string::npos) {
            std::getline(lines, line);
            return line;
        }
    }
    return "(frame " + std::to_string(frame) + " not in the dump)";
}

class ReportPageTest : public ::testing::Test {
protected:
    void SetUp() override
    {
        const auto program = HeadlessChromium::path();
        if (!program) GTEST_SKIP() << "chromium is not installed (scripts/install-deps installs it)";
        browser.emplace(*program, dir.path());
    }

    fs::path report(const std::string& example)
    {
        const fs::path page = dir.file(example + ".html");
        const ToolRun run = runTool({"report", examplePath(example), "-o", page});
        EXPECT_EQ(run.status, 0) << run.err;
        return page;
    }

    TempDir dir;
    std::optional<HeadlessChromium> browser;
};

class ReportPageBrowserTest : public ReportPageTest, public ::testing::WithParamInterface<std::string> {};
using ReportPageScreenshotTest = ReportPageTest;

// The page of each example, opened at its last gesture's frame: drawn, every
// event of replay --jsonl listed in order, the counters of --get, the frame's
// description as the recogniser's dump has it, nothing fetched, no error.
TEST_P(ReportPageBrowserTest, PageShowsWhatReplaySees)
{
    const std::string example = GetParam();
    const std::string recording = examplePath(example);
    const fs::path page = report(example);
    const std::string html = readFile(page);
    EXPECT_FALSE(std::regex_search(html, std::regex(R"((https?:|ftp:)//|\bsrc\s*=|\bhref\s*=|url\(|@import)",
                                                    std::regex::icase)))
        << "the page refers to something outside itself";

    const ToolRun replay = runTool({"replay", recording, "--jsonl", "--get", "Algs.EventStats"});
    ASSERT_EQ(replay.status, 0) << replay.err;
    std::int64_t lastFrame = 0;
    json counters;
    for (const json& line : jsonLinesOf(replay.out)) {
        if (line.contains("frame") && line["frame"].get<std::int64_t>() > 0) lastFrame = line["frame"];
        if (line.contains("key")) counters = line["value"];
    }
    const ToolRun dump = runTool({"replay", recording, "--dump"});
    ASSERT_EQ(dump.status, 0) << dump.err;

    const auto run = browser->dumpDom("file://" + page.string() + "#frame=" + std::to_string(lastFrame));
    ASSERT_TRUE(run.exited) << run.err;
    const std::string& dom = run.out;
    EXPECT_TRUE(std::regex_search(dom, std::regex(R"re(<body[^>]*data-ready="1")re")));
    EXPECT_EQ(run.pageRequests, std::vector<std::string>{});
    EXPECT_TRUE(std::regex_search(dom, std::regex(R"re(<html[^>]*data-errors="0")re")));
    EXPECT_EQ(matches(dom, R"re(<div id="errors"[^>]*>([^<]+)</div>)re"), std::vector<std::vector<std::string>>{});

    std::vector<std::string> listed;
    for (const auto& item : matches(dom, R"re(<li data-gesture="([^"]*)" data-region="([^"]*)" data-frame="([^"]*)")re")) {
        // Replay's reset lines carry neither region nor frame.
        listed.push_back(item[0] == "device-reset" ? "device-reset  0" : item[0] + " " + item[1] + " " + item[2]);
    }
    EXPECT_EQ(listed, eventsOf(replay.out));

    json shown;
    for (const auto& row :
         matches(dom, R"re(<tr data-group="([^"]*)" data-key="([^"]*)"><td>[^<]*</td><td>[^<]*</td><td class="num">([^<]*)</td>)re")) {
        shown[row[0]][row[1]] = std::stoull(row[2]);
    }
    EXPECT_EQ(shown, counters);

    const auto description = matches(dom, R"re(<pre id="description">([^<]*)</pre>)re");
    ASSERT_EQ(description.size(), 1u);
    EXPECT_EQ(unescapeHtml(description[0][0]), dumpedDescription(dump.out, lastFrame));
}

INSTANTIATE_TEST_SUITE_P(Examples, ReportPageBrowserTest, ::testing::ValuesIn(exampleNames()),
                         [](const auto& info) {
                             std::string name = info.param;
                             std::replace(name.begin(), name.end(), '-', '_');
                             return name;
                         });

// A screenshot of the demo's page is a picture, not an empty page: the
// browser itself measures the variance of its pixels' brightness. With
// VELTOTOUCH_REPORT_SCREENSHOT set, the picture is kept there (the README's).
TEST_F(ReportPageScreenshotTest, DemoPageIsDrawn)
{
    const fs::path page = report("demo");
    const fs::path png = dir.file("demo.png");
    const auto shot = browser->screenshot("file://" + page.string(), png);
    ASSERT_TRUE(shot.exited) << shot.err;
    EXPECT_EQ(shot.pageRequests, std::vector<std::string>{});

    const std::string bytes = readFile(png);
    ASSERT_GT(bytes.size(), 8u);
    const std::string checker = R"(<!DOCTYPE html><body><img id="shot" src="data:image/png;base64,)" +
                                VeltoTouch::ColumnEncoder::toBase64(bytes) + R"(">
<script>
const image = document.getElementById('shot');
function measure() {
  const canvas = document.createElement('canvas');
  canvas.width = image.naturalWidth;
  canvas.height = image.naturalHeight;
  const context = canvas.getContext('2d');
  context.drawImage(image, 0, 0);
  const pixels = context.getImageData(0, 0, canvas.width, canvas.height).data;
  let sum = 0, squares = 0;
  const count = pixels.length / 4;
  for (let i = 0; i < pixels.length; i += 4) {
    const y = 0.299 * pixels[i] + 0.587 * pixels[i + 1] + 0.114 * pixels[i + 2];
    sum += y;
    squares += y * y;
  }
  const mean = sum / count;
  document.body.setAttribute('data-size', canvas.width + 'x' + canvas.height);
  document.body.setAttribute('data-variance', String(Math.round(squares / count - mean * mean)));
}
if (image.complete) measure(); else image.onload = measure;
</script></body>)";
    const fs::path checkPage = dir.file("check.html", checker);
    const auto check = browser->dumpDom("file://" + checkPage.string());
    ASSERT_TRUE(check.exited) << check.err;
    const auto size = matches(check.out, R"re(data-size="(\d+)x(\d+)")re");
    const auto variance = matches(check.out, R"re(data-variance="(\d+)")re");
    ASSERT_EQ(size.size(), 1u) << "the screenshot could not be read";
    EXPECT_EQ(size[0], (std::vector<std::string>{"1400", "900"}));
    ASSERT_EQ(variance.size(), 1u);
    // A blank page has none; the drawn heat map, lines and text give thousands.
    EXPECT_GT(std::stoi(variance[0][0]), 500);

    if (const char* keep = std::getenv("VELTOTOUCH_REPORT_SCREENSHOT")) fs::copy_file(png, keep, fs::copy_options::overwrite_existing);
}

}  // namespace
}  // namespace VeltoTool::Testing
