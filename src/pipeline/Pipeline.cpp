#include "pipeline/Pipeline.h"

#include "platform/values/PropertyDictionary.h"
#include "records/DomainKey.h"

namespace VeltoTouch {

using VeltoHost::HidEvent;
using VeltoHost::HidEventList;

void Pipeline::setTime(std::uint64_t time)
{
    if (setTimeProbe) setTimeProbe(time);
    _time = time;
}

void Pipeline::setState(const std::string& key, PropertyValue value)
{
    if (setStateProbe) setStateProbe(key, value);
    std::string algsKey = key;
    // The pipeline has no writable keys of its own; anything outside the
    // recogniser's domain is ignored.
    if (Util::stripDomainFromKey(algsKey, kAlgsDomain)) _algs.setState(algsKey, std::move(value));
}

PropertyValue Pipeline::getState(const std::string& key)
{
    if (getStateProbe) getStateProbe(key);
    std::string algsKey = key;
    if (Util::stripDomainFromKey(algsKey, kAlgsDomain)) return _algs.getState(algsKey);
    if (key == kDebugInfoKey) {
        VeltoHost::PropertyDictionary info;
        info.set("ResetCount", PropertyValue::uint32(_resetCount));
        info.set("DisjointImageCount", PropertyValue::uint32(_disjointImageCount));
        return PropertyValue::dictionary(std::move(info));
    }
    return PropertyValue::null();
}

void Pipeline::handleInputReport(const std::uint8_t* data, std::size_t length)
{
    if (inputReportProbe) inputReportProbe(data, length);
    // Firmware events are tried first: a report is an image only when it is
    // not a firmware event.
    if (auto event = InputReport::FirmwareEvent::parse(data, length)) {
        handleFirmwareEvent(*event);
    } else if (auto image = InputReport::Image::parse(data, length)) {
        handleImage(*image);
    } else if (invalidInputReportProbe) {
        invalidInputReportProbe(data, length);
    }
}

void Pipeline::handleFirmwareEvent(const InputReport::FirmwareEvent& event)
{
    if (firmwareEventProbe) firmwareEventProbe(event);
    if (event.event != InputReport::FirmwareEvent::kEventDeviceReset) return;
    ++_resetCount;
    HidEventList events = _algs.handleReset();
    events.push_back(HidEvent::createVendorDefinedEvent(0, kResetEventUsagePage, kResetEventUsage, 0, nullptr, 0, 0));
    handleHIDEvents(events);
}

void Pipeline::handleImage(const InputReport::Image& image)
{
    if (imageProbe) imageProbe(image);
    // A reset does not clear the last frame number, so continuity is checked
    // across resets too; unsigned arithmetic makes 0xFFFFFFFF -> 0 continuous.
    if (_lastFrameNumber && image.frameNumber != static_cast<std::uint32_t>(*_lastFrameNumber + 1u)) {
        ++_disjointImageCount;
        if (disjointImageProbe) disjointImageProbe(*_lastFrameNumber, image);
    }
    _lastFrameNumber = image.frameNumber;
    handleHIDEvents(_algs.handleImage(image));
}

void Pipeline::handleHIDEvents(const HidEventList& events)
{
    for (const auto& event : events) event->setTimeStamp(_time);
    if (hidEventsProbe && !events.empty()) hidEventsProbe(events);
}

}  // namespace VeltoTouch
