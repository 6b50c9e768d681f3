#pragma once

#include "platform/values/PropertyValue.h"

#include <nlohmann/json.hpp>

#include <string>
#include <vector>

namespace VeltoTouch {

// One piece of pipeline state applied before a recording is replayed: a key
// relative to the pipeline ("Algs.HoldTimeoutMilliseconds") and its value as
// JSON. Kept as JSON rather than as a PropertyValue so that settings can be
// copied, compared and written into a report freely.
struct PipelineSetting {
    std::string key;
    nlohmann::json value;

    VeltoHost::PropertyValue propertyValue() const;
    // "Algs.HoldTimeoutMilliseconds=600"
    std::string text() const;

    friend bool operator==(const PipelineSetting&, const PipelineSetting&) = default;
};

using PipelineSettings = std::vector<PipelineSetting>;

}  // namespace VeltoTouch
