#pragma once

#include <cstdint>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <vector>

namespace VeltoHost {

class HidEvent;

// Events are shared by reference counting: whoever holds a HidEventRef holds a
// reference, and a list of events holds one per entry.
using HidEventRef = std::shared_ptr<HidEvent>;
using HidEventList = std::vector<HidEventRef>;

// The host's event record: a digitizer event or a vendor-defined event.
// The creator sets its fields, the pipeline stamps its time, and from then on
// it is only read (by the dispatch job on the host's queue).
class HidEvent {
public:
    enum class Kind { Digitizer, VendorDefined };

    // The host's numeric event type codes.
    static constexpr std::uint32_t kTypeVendorDefined = 1;
    static constexpr std::uint32_t kTypeDigitizer = 11;

    // Phase bits.
    static constexpr std::uint16_t kPhaseBegan = 0x0001;
    static constexpr std::uint16_t kPhaseChanged = 0x0002;
    static constexpr std::uint16_t kPhaseEnded = 0x0004;
    static constexpr std::uint16_t kPhaseCancelled = 0x0008;
    static constexpr std::uint16_t kPhaseMayBegin = 0x0080;

    struct Digitizer {
        std::uint32_t transducerType = 0;
        std::uint32_t index = 0;
        std::uint32_t identity = 0;
        std::uint32_t eventMask = 0;
        std::uint32_t buttonMask = 0;
        double x = 0;
        double y = 0;
        double z = 0;
        double tipPressure = 0;
        double barrelPressure = 0;
        bool range = false;
        bool touch = false;
        std::uint32_t options = 0;
    };

    struct VendorDefined {
        std::uint32_t usagePage = 0;
        std::uint32_t usage = 0;
        std::uint32_t version = 0;
        std::vector<std::uint8_t> payload;
        std::uint32_t options = 0;
    };

    static HidEventRef createDigitizerEvent(std::uint64_t timeStamp, std::uint32_t transducerType, std::uint32_t index,
                                            std::uint32_t identity, std::uint32_t eventMask, std::uint32_t buttonMask,
                                            double x, double y, double z, double tipPressure, double barrelPressure,
                                            bool range, bool touch, std::uint32_t options);
    static HidEventRef createVendorDefinedEvent(std::uint64_t timeStamp, std::uint32_t usagePage, std::uint32_t usage,
                                                std::uint32_t version, const std::uint8_t* payload,
                                                std::size_t payloadLength, std::uint32_t options);

    Kind kind() const noexcept { return _kind; }
    std::uint32_t type() const noexcept { return _kind == Kind::Digitizer ? kTypeDigitizer : kTypeVendorDefined; }

    std::uint64_t timeStamp() const noexcept { return _timeStamp; }
    void setTimeStamp(std::uint64_t ticks) noexcept { _timeStamp = ticks; }

    std::uint16_t phase() const noexcept { return _phase; }
    void setPhase(std::uint16_t phase) noexcept { _phase = phase; }

    void setIntegerValue(std::uint32_t field, std::int64_t value) { _integerFields[field] = value; }
    std::optional<std::int64_t> integerValue(std::uint32_t field) const;

    // Valid only for the matching kind; the other kind reads as all zero.
    const Digitizer& digitizer() const noexcept { return _digitizer; }
    const VendorDefined& vendorDefined() const noexcept { return _vendor; }

    // One line for the log, listing the kind and every field that was set.
    std::string description() const;

private:
    explicit HidEvent(Kind kind, std::uint64_t timeStamp) : _kind(kind), _timeStamp(timeStamp) {}

    Kind _kind;
    std::uint64_t _timeStamp;
    std::uint16_t _phase = 0;
    std::map<std::uint32_t, std::int64_t> _integerFields;
    Digitizer _digitizer;
    VendorDefined _vendor;
};

}  // namespace VeltoHost
