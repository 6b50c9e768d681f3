#include "SynthCommand.h"

#include "GestureScript.h"
#include "Synthesizer.h"
#include "ToolError.h"
#include "ToolFiles.h"

namespace VeltoTool {

std::string SynthCommand::containerFor(const std::string& script, std::uint32_t framePeriodMs, std::uint32_t seed)
{
    if (framePeriodMs == 0) throw ToolError("--frame-period must be at least 1 ms");
    Synthesizer synthesizer(framePeriodMs, seed);
    return synthesizer.synthesize(GestureScript::parse(script)).json();
}

void SynthCommand::run(const Options& options)
{
    const std::string script =
        !options.script.empty() && options.script[0] == '@' ? ToolFiles::read(options.script.substr(1)) : options.script;
    ToolFiles::write(options.output, containerFor(script, options.framePeriodMs, options.seed));
}

}  // namespace VeltoTool
