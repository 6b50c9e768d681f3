#pragma once

#include "platform/values/PropertyValue.h"

#include <string>

namespace VeltoTouch {

// The read side of a pipeline: state keys relative to the stage.
class PipelineOutput {
public:
    virtual VeltoHost::PropertyValue getState(const std::string& key) = 0;

protected:
    ~PipelineOutput() = default;
};

}  // namespace VeltoTouch
