#pragma once

#include "DescriptorWriteBuffer.h"

#include <ostream>
#include <string>
#include <vector>

namespace VeltoTool {

// A file a command writes, replaced only once it is complete. The text goes
// to a temporary file beside the output, renamed over it by commit() when
// every write has succeeded; a failure, an exception or a stop signal before
// that leaves the old output exactly as it was and no temporary file behind.
//
// An output that is a symbolic link replaces the file it points to and the
// link stays. An existing output keeps its mode; a new one gets the mode an
// ordinary create gives it (0666 less the umask). An existing output that is
// not a regular file (/dev/null, a pipe) is written directly: there is
// nothing to replace.
//
// Every error is a ToolError that starts with the output's path.
class OutputFile {
public:
    // Refuses, before anything is written, a directory, an output that is the
    // same file as one of `inputs` (through a link too), and a directory the
    // temporary file cannot be made in.
    explicit OutputFile(std::string path, const std::vector<std::string>& inputs = {});
    ~OutputFile();

    OutputFile(const OutputFile&) = delete;
    OutputFile& operator=(const OutputFile&) = delete;

    const std::string& path() const { return _path; }
    std::ostream& stream() { return _stream; }
    // The temporary file, open for reading and writing (an output written
    // directly: open for writing), for a writer that takes a descriptor, such
    // as a daemon handed it over the bus. What it writes goes into place with
    // commit() as the stream's text does.
    int descriptor() const { return _descriptor; }

    // Throws once a write to stream() has failed, so that a long output stops
    // at its first failure rather than after the rest is made.
    void checkWritten() const;
    // Flushes, checks every write (also those the file system reports late)
    // and renames the file into place.
    void commit();

    // The same file: the same device and inode when both exist, else the same
    // path once links are followed (two outputs not made yet).
    static bool sameFile(const std::string& first, const std::string& second);

private:
    // What the constructor prepares before the stream is set up on it.
    struct Opened {
        std::string target;
        std::string temporary;
        int descriptor;
        int removalSlot;
    };
    static Opened prepare(const std::string& path, const std::vector<std::string>& inputs);
    OutputFile(Opened opened, std::string path);
    [[noreturn]] void fail(int error) const;

    std::string _path;
    // Empty when the output is written directly.
    std::string _target;
    std::string _temporary;
    int _descriptor;
    // The temporary file's place among those a stop signal removes, or -1.
    int _removalSlot;
    bool _committed = false;
    DescriptorWriteBuffer _buffer{_descriptor};
    std::ostream _stream{&_buffer};
};

}  // namespace VeltoTool
