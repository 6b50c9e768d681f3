#pragma once

#include "platform/values/PropertyValue.h"

#include <cstddef>
#include <cstdint>
#include <string>

namespace VeltoTouch {

using VeltoHost::PropertyValue;

// The input side of a pipeline stage. Stages are chained (a recorder in front
// of a pipeline) and always owned through their concrete type, so there is
// deliberately no virtual destructor.
class PipelineInput {
public:
    virtual void setTime(std::uint64_t time) = 0;
    virtual void setState(const std::string& key, PropertyValue value) = 0;
    virtual void handleInputReport(const std::uint8_t* data, std::size_t length) = 0;

protected:
    ~PipelineInput() = default;
};

}  // namespace VeltoTouch
