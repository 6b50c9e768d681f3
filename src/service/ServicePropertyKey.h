#pragma once

#include <array>

namespace VeltoTouch {

// The properties the service answers itself, beside the pipeline's state
// under "Pipeline." and the device's own properties, which it passes on.
// Plain constants, so that the tool can list them without linking the
// service; a test holds them to what the service answers.
struct ServicePropertyKey {
    const char* name;
    const char* type;
    bool writable;
    const char* meaning;
};

inline constexpr std::array<ServicePropertyKey, 5> kServicePropertyKeys = {{
    {"Version", "array", false, "the plug-in's version, three integers"},
    {"FirmwareDebugReports", "dictionary", false,
     "each firmware debug feature report by ID (\"0x..\"), as hex text, or why it could not be read"},
    {"FactoryResetHoldDuration", "uint32", false, "the device's factory-reset hold time, from its feature report"},
    {"Recording", "string", false, "the recent reports and state changes as a recording container (JSON)"},
    {"ServicePluginDebug", "dictionary", false,
     "Version, FirmwareDebugReports, Recording, Pipeline.DebugInfo and Pipeline.Algs.DebugInfo together"},
}};

// The pipeline's state: "Pipeline.KEY" reads and writes KEY of the pipeline,
// and a write is recorded. Any other key is the device's property.
inline constexpr const char* kPipelineDomain = "Pipeline";

}  // namespace VeltoTouch
