#pragma once

#include <string>
#include <string_view>

namespace VeltoHost {

// Tells whether a path names a hidraw device node, before anything opens it.
//
// Opening /dev/null, a regular file or a terminal as a touch device would
// succeed and then deliver nothing (or garbage) forever; the host refuses such
// a path at once instead. The answer comes from the node's device number and
// the kernel's device database (udev): a character device of the "hidraw"
// subsystem.
class HidrawNode {
public:
    // Empty when `path` is a hidraw node; otherwise what the path is instead,
    // as the end of a sentence that starts with the path: "is a regular file",
    // "is a character device of the \"mem\" subsystem", "does not exist".
    static std::string whatElse(const std::string& path);
    // Empty when `path` is a hidraw node; otherwise the line refusing it:
    // "PATH is a regular file; expected a hidraw device node (/dev/hidrawN)",
    // then `orElse` for a program that takes something besides.
    static std::string refusal(const std::string& path, std::string_view orElse = {});
};

}  // namespace VeltoHost
