#pragma once

#include <sys/types.h>

#include <string>

namespace VeltoHost {

// What kind of file a mode describes, in words for a message: "a regular
// file", "a directory", "a character device", ... so that a refusal says
// what was found instead of what was wanted.
std::string fileKind(mode_t mode);

}  // namespace VeltoHost
