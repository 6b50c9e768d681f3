#include "platform/plugin/HidEvent.h"

#include <cstdio>

namespace VeltoHost {

HidEventRef HidEvent::createDigitizerEvent(std::uint64_t timeStamp, std::uint32_t transducerType, std::uint32_t index,
                                           std::uint32_t identity, std::uint32_t eventMask, std::uint32_t buttonMask,
                                           double x, double y, double z, double tipPressure, double barrelPressure,
                                           bool range, bool touch, std::uint32_t options)
{
    HidEventRef event(new HidEvent(Kind::Digitizer, timeStamp));
    event->_digitizer = Digitizer{transducerType, index, identity, eventMask, buttonMask, x, y, z, tipPressure,
                                  barrelPressure, range, touch, options};
    return event;
}

HidEventRef HidEvent::createVendorDefinedEvent(std::uint64_t timeStamp, std::uint32_t usagePage, std::uint32_t usage,
                                               std::uint32_t version, const std::uint8_t* payload,
                                               std::size_t payloadLength, std::uint32_t options)
{
    HidEventRef event(new HidEvent(Kind::VendorDefined, timeStamp));
    event->_vendor.usagePage = usagePage;
    event->_vendor.usage = usage;
    event->_vendor.version = version;
    if (payload && payloadLength) event->_vendor.payload.assign(payload, payload + payloadLength);
    event->_vendor.options = options;
    return event;
}

std::optional<std::int64_t> HidEvent::integerValue(std::uint32_t field) const
{
    auto it = _integerFields.find(field);
    if (it == _integerFields.end()) return std::nullopt;
    return it->second;
}

std::string HidEvent::description() const
{
    char text[320];
    if (_kind == Kind::Digitizer) {
        const Digitizer& d = _digitizer;
        std::snprintf(text, sizeof text,
                      "HidEvent type=%u(digitizer) timestamp=%llu phase=0x%x transducer=%u index=%u identity=%u "
                      "eventMask=0x%x buttonMask=0x%x x=%g y=%g z=%g tipPressure=%g barrelPressure=%g range=%d "
                      "touch=%d options=0x%x",
                      static_cast<unsigned>(type()), static_cast<unsigned long long>(_timeStamp),
                      static_cast<unsigned>(_phase), d.transducerType, d.index, d.identity, d.eventMask, d.buttonMask,
                      d.x, d.y, d.z, d.tipPressure, d.barrelPressure, d.range ? 1 : 0, d.touch ? 1 : 0, d.options);
    } else {
        const VendorDefined& v = _vendor;
        std::snprintf(text, sizeof text,
                      "HidEvent type=%u(vendor-defined) timestamp=%llu phase=0x%x usagePage=0x%x usage=%u version=%u "
                      "payloadLength=%zu options=0x%x",
                      static_cast<unsigned>(type()), static_cast<unsigned long long>(_timeStamp),
                      static_cast<unsigned>(_phase), v.usagePage, v.usage, v.version, v.payload.size(), v.options);
    }
    std::string out = text;
    for (const auto& [field, value] : _integerFields) {
        std::snprintf(text, sizeof text, " field[0x%08x]=%lld", field, static_cast<long long>(value));
        out += text;
    }
    return out;
}

}  // namespace VeltoHost
