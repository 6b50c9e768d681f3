#include "evaluation/TruthMatcher.h"

#include "records/TickConversion.h"

#include <gtest/gtest.h>

#include <map>
#include <string>
#include <utility>
#include <vector>

using namespace VeltoTouch;
using Kind = TruthRecord::Kind;
using Region = Gesture::Region;

namespace {

std::uint64_t ms(std::uint64_t milliseconds) { return Util::machTimeFromNanoseconds(milliseconds * 1'000'000); }

TruthRecord truth(Kind kind, Region region, Region to, std::uint64_t startMs, std::uint64_t endMs)
{
    return {kind, region, to, ms(startMs), ms(endMs)};
}

RecordingReplay::TimedGesture event(Gesture::Kind kind, Region region, std::uint64_t atMs)
{
    return {Gesture{kind, region}, ms(atMs)};
}

using Cells = std::map<std::pair<std::string, std::string>, std::uint64_t>;

struct Case {
    const char* name;
    std::vector<TruthRecord> truths;
    std::vector<RecordingReplay::TimedGesture> events;
    Cells confusion;
    std::uint64_t spurious;
    std::uint64_t unwanted;
    // Per kind met and, for met ones, the latencies.
    std::map<Kind, std::uint64_t> met;
    std::map<Kind, std::vector<double>> latenciesMs;
};

}  // namespace

TEST(TruthMatcher, MatchesRecognisedGesturesToTheirTouches)
{
    const Region top = Region::Top, middle = Region::Middle, bottom = Region::Bottom, none = Region::None;
    using G = Gesture::Kind;
    const std::vector<Case> cases = {
        {"a tap recognised late, within the window after the touch",
         {truth(Kind::Tap, top, top, 1000, 1120)},
         {event(G::MayBegin, top, 1010), event(G::Tap, top, 1300)},
         {{{"tap top", "tap top"}, 1}},
         0, 0, {{Kind::Tap, 1}}, {{Kind::Tap, {300}}}},
        {"a tap recognised too late is a miss and a spurious tap",
         {truth(Kind::Tap, top, top, 1000, 1120)},
         {event(G::Tap, top, 1330)},
         {{{"tap top", "missed"}, 1}, {{"spurious", "tap top"}, 1}},
         1, 0, {}, {}},
        {"a tap during a palm is unwanted, the palm not rejected",
         {truth(Kind::Palm, none, none, 1000, 2500)},
         {event(G::MayBegin, middle, 1010), event(G::Tap, middle, 1400), event(G::MayBegin, middle, 1500),
          event(G::Cancel, none, 2490)},
         {{{"palm", "tap middle"}, 1}},
         0, 1, {}, {}},
        {"a palm that brings a cancel only is rejected",
         {truth(Kind::Palm, none, none, 1000, 2500)},
         {event(G::MayBegin, middle, 1010), event(G::Cancel, none, 2490)},
         {{{"palm", "none"}, 1}},
         0, 0, {{Kind::Palm, 1}}, {}},
        {"a slide that ends in the wrong region",
         {truth(Kind::Slide, top, bottom, 1000, 1900)},
         {event(G::HoldStart, top, 1510), event(G::HoldChange, middle, 1700), event(G::HoldEnd, middle, 1890)},
         {{{"slide top>bottom", "slide top>middle"}, 1}},
         0, 0, {}, {}},
        {"a slide decided by the change into its end region",
         {truth(Kind::Slide, top, bottom, 1000, 1900)},
         {event(G::HoldStart, middle, 1510), event(G::HoldChange, bottom, 1700), event(G::HoldEnd, bottom, 1890)},
         {{{"slide top>bottom", "slide middle>bottom"}, 1}},
         0, 0, {{Kind::Slide, 1}}, {{Kind::Slide, {700}}}},
        {"a hold that changed region is no hold",
         {truth(Kind::Hold, top, top, 1000, 2000)},
         {event(G::HoldStart, top, 1510), event(G::HoldChange, middle, 1700), event(G::HoldEnd, middle, 1990)},
         {{{"hold top", "slide top>middle"}, 1}},
         0, 0, {}, {}},
        {"two truths competing for one tap: the earlier takes it, the other is missed",
         {truth(Kind::Tap, middle, middle, 1000, 1120), truth(Kind::Tap, middle, middle, 1270, 1390)},
         {event(G::Tap, middle, 1300)},
         {{{"tap middle", "tap middle"}, 1}, {{"tap middle", "missed"}, 1}},
         0, 0, {{Kind::Tap, 1}}, {{Kind::Tap, {300}}}},
        {"a wrong gesture first does not take the truth a right one meets",
         {truth(Kind::Hold, bottom, bottom, 1000, 2500)},
         {event(G::Tap, middle, 1100), event(G::HoldStart, bottom, 1510), event(G::HoldEnd, bottom, 2490)},
         {{{"hold bottom", "hold bottom"}, 1}, {{"spurious", "tap middle"}, 1}},
         1, 0, {{Kind::Hold, 1}}, {{Kind::Hold, {510}}}},
        {"a reset is met by the vendor event only",
         {truth(Kind::Reset, none, none, 3000, 3000), truth(Kind::Noise, none, none, 3000, 3300)},
         {event(G::DeviceReset, none, 3000)},
         {{{"reset", "reset"}, 1}, {{"noise", "none"}, 1}},
         0, 0, {{Kind::Reset, 1}, {Kind::Noise, 1}}, {{Kind::Reset, {0}}}},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.name);
        const EvaluationResult result = TruthMatcher::match(c.truths, {c.events, ms(5000)});
        EXPECT_EQ(result.confusion, c.confusion);
        EXPECT_EQ(result.spurious, c.spurious);
        EXPECT_EQ(result.unwanted, c.unwanted);
        for (Kind kind : {Kind::Tap, Kind::Hold, Kind::Slide, Kind::Palm, Kind::Noise, Kind::Reset}) {
            const auto met = c.met.find(kind);
            EXPECT_EQ(result.counts(kind).met, met == c.met.end() ? 0u : met->second) << TruthRecord::name(kind);
            const auto latencies = c.latenciesMs.find(kind);
            EXPECT_EQ(result.counts(kind).latenciesMs,
                      latencies == c.latenciesMs.end() ? std::vector<double>{} : latencies->second)
                << TruthRecord::name(kind);
        }
    }
}
