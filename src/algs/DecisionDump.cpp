#include "algs/DecisionDump.h"

#include "platform/log/LogFormat.h"

#include <cstdarg>
#include <cstdio>

namespace VeltoTouch {

namespace {

// Appends C printf output, so that the dumps match the C library's formatting exactly.
__attribute__((format(printf, 2, 3))) void appendFormat(std::string& out, const char* format, ...)
{
    char buffer[256];
    va_list args;
    va_start(args, format);
    va_list retry;
    va_copy(retry, args);
    const int needed = std::vsnprintf(buffer, sizeof buffer, format, args);
    va_end(args);
    if (needed >= 0 && static_cast<std::size_t>(needed) < sizeof buffer) {
        out.append(buffer, static_cast<std::size_t>(needed));
    } else if (needed >= 0) {
        std::string large(static_cast<std::size_t>(needed) + 1, '\0');
        std::vsnprintf(large.data(), large.size(), format, retry);
        out.append(large.data(), static_cast<std::size_t>(needed));
    }
    va_end(retry);
}

const char* onMark(bool active) { return active ? "<==ON" : ""; }

std::string handFeaturesText(const DecisionRecord& record)
{
    std::string text;
    appendFormat(text, "ts=%f, sd=%f, tsd=%f, NonActivePixels=%d, TimeDurationRatio=%f, TapSVMScore=%f, ",
                 static_cast<double>(record.touchScore), static_cast<double>(record.signalPerDuration),
                 static_cast<double>(record.signalPerTouchDuration), record.nonActivePixels,
                 static_cast<double>(record.timeDurationRatio), static_cast<double>(record.tapScore));
    return text;
}

// One word for the phase of the touch in this frame, its time and region,
// and at a release whether anything is still above noise.
std::string stateText(const DecisionRecord& record)
{
    const std::int32_t ms = record.phaseMs;
    const int region = static_cast<int>(record.activeRegion);
    const char* noise = record.aboveNoise ? "ABOVENOISE" : "BELOWNOISE";

    std::string text;
    switch (record.phase) {
    case TouchPhase::Idle: break;
    case TouchPhase::StartTouch: appendFormat(text, "STARTTOUCH %dms ActiveRegion=%d", ms, region); break;
    case TouchPhase::Holding: appendFormat(text, "HOLDING %dms ActiveRegion=%d", ms, region); break;
    case TouchPhase::StartHold: appendFormat(text, "STARTHOLD %dms ActiveRegion=%d", ms, region); break;
    case TouchPhase::SuppressHold: appendFormat(text, "SUPPRESSHOLD %dms ActiveRegion=%d", ms, region); break;
    case TouchPhase::Touching: appendFormat(text, "TOUCHING %dms ActiveRegion=%d", ms, region); break;
    case TouchPhase::EndHold: appendFormat(text, "ENDHOLD %dms ActiveRegion=%d %s", ms, region, noise); break;
    case TouchPhase::Tap: appendFormat(text, "TAP %dms ActiveRegion=%d %s", ms, region, noise); break;
    case TouchPhase::SuppressTap: appendFormat(text, "SUPPRESSTAP %dms ActiveRegion=%d %s", ms, region, noise); break;
    case TouchPhase::EndTouch: appendFormat(text, "ENDTOUCH %dms ActiveRegion=%d %s", ms, region, noise); break;
    }
    return text;
}

}  // namespace

std::string DecisionDump::message(std::size_t which, const DecisionRecord& record)
{
    const unsigned int frame = record.frameNumber;
    const unsigned int time = record.timeMs;
    switch (which) {
    case 0:
        return VeltoHost::formatLog("Frame %u @%ums, *** Event Stats ***\n%@", frame, time,
                                    record.counters.statsDictionary());
    case 1:
        return VeltoHost::formatLog("Frame %u @%ums, *** Touch State Description ***\n%@", frame, time,
                                    touchStateDescription(record));
    default:
        return VeltoHost::formatLog("Frame %u @%ums, *** Virtual State Description ***\n%@", frame, time,
                                    virtualStateDescription(record));
    }
}

std::string DecisionDump::touchStateDescription(const DecisionRecord& record)
{
    std::string text = handFeaturesText(record);
    text += '[';
    for (std::size_t pad = 0; pad < DecisionRecord::kPadCount; ++pad) {
        if (pad > 0) text += ", ";
        appendFormat(text, "%c=%4d %4d%s", static_cast<int>('A' + pad), record.readings[pad], record.levels[pad],
                     onMark(record.activePads & (1u << pad)));
    }
    text += "] ";
    text += stateText(record);
    return text;
}

std::string DecisionDump::virtualStateDescription(const DecisionRecord& record)
{
    std::string text = handFeaturesText(record);
    text += '[';
    for (std::size_t group = 0; group < DecisionRecord::kVirtualCount; ++group) {
        if (group > 0) text += ", ";
        appendFormat(text, "%s=%4d%s", VirtualImage::groupName(group).data(), record.virtualLevels[group],
                     onMark(record.activeVirtualPixels & (1u << group)));
    }
    text += "] ";
    text += stateText(record);
    return text;
}

}  // namespace VeltoTouch
