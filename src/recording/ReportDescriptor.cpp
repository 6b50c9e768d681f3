#include "recording/ReportDescriptor.h"

#include "records/InputReport.h"

#include <limits>

namespace VeltoTouch {

namespace {

// Short items: the tag and type in the high six bits of the prefix, the
// number of data bytes in the low two (3 meaning 4).
constexpr std::uint8_t kLongItemPrefix = 0xFE;
constexpr std::uint8_t kInputTag = 0x80;
constexpr std::uint8_t kReportSizeTag = 0x74;
constexpr std::uint8_t kReportIDTag = 0x84;
constexpr std::uint8_t kReportCountTag = 0x94;
constexpr std::uint8_t kPushTag = 0xA4;
constexpr std::uint8_t kPopTag = 0xB4;
constexpr std::size_t kDeepestPush = 32;

struct Globals {
    std::uint64_t reportSize = 0;
    std::uint64_t reportCount = 0;
    std::uint8_t reportID = 0;
};

// size * count, held at the largest number rather than wrapped: a length so
// large matches no report anyway.
std::uint64_t bitsOf(const Globals& globals)
{
    constexpr std::uint64_t kMost = std::numeric_limits<std::uint64_t>::max();
    if (globals.reportSize != 0 && globals.reportCount > kMost / globals.reportSize) return kMost;
    return globals.reportSize * globals.reportCount;
}

}  // namespace

std::map<std::uint8_t, std::size_t> ReportDescriptor::inputReportLengths(const std::vector<std::uint8_t>& descriptor)
{
    std::map<std::uint8_t, std::uint64_t> bits;
    Globals globals;
    std::vector<Globals> pushed;
    std::size_t at = 0;
    while (at < descriptor.size()) {
        const std::uint8_t prefix = descriptor[at];
        if (prefix == kLongItemPrefix) {
            // Prefix, data size, long tag, data: nothing of the reports' shape.
            if (at + 1 >= descriptor.size()) break;
            at += 3 + std::size_t{descriptor[at + 1]};
            continue;
        }
        const std::size_t size = (prefix & 3) == 3 ? 4 : prefix & 3;
        if (at + 1 + size > descriptor.size()) break;
        std::uint64_t data = 0;
        for (std::size_t i = 0; i < size; ++i) data |= std::uint64_t{descriptor[at + 1 + i]} << (8 * i);
        switch (prefix & 0xFC) {
        case kReportSizeTag: globals.reportSize = data; break;
        case kReportCountTag: globals.reportCount = data; break;
        case kReportIDTag: globals.reportID = static_cast<std::uint8_t>(data); break;
        case kPushTag:
            if (pushed.size() < kDeepestPush) pushed.push_back(globals);
            break;
        case kPopTag:
            if (!pushed.empty()) {
                globals = pushed.back();
                pushed.pop_back();
            }
            break;
        case kInputTag: {
            std::uint64_t& total = bits[globals.reportID];
            const std::uint64_t more = bitsOf(globals);
            total = more > std::numeric_limits<std::uint64_t>::max() - total ? std::numeric_limits<std::uint64_t>::max()
                                                                             : total + more;
            break;
        }
        default: break;
        }
        at += 1 + size;
    }
    std::map<std::uint8_t, std::size_t> lengths;
    for (const auto& [reportID, count] : bits) {
        const std::uint64_t bytes = count / 8 + (count % 8 != 0 ? 1 : 0) + (reportID != 0 ? 1 : 0);
        lengths[reportID] = bytes > std::numeric_limits<std::size_t>::max() ? std::numeric_limits<std::size_t>::max()
                                                                             : static_cast<std::size_t>(bytes);
    }
    return lengths;
}

bool ReportDescriptor::declaresSurfaceReports(const std::vector<std::uint8_t>& descriptor)
{
    using namespace InputReport;
    const auto lengths = inputReportLengths(descriptor);
    const auto has = [&](std::uint8_t reportID, std::size_t length) {
        const auto found = lengths.find(reportID);
        return found != lengths.end() && found->second == length;
    };
    return has(Image::kReportID, Image::kLength) && has(FirmwareEvent::kReportID, FirmwareEvent::kLength);
}

}  // namespace VeltoTouch
