#include "OutputFile.h"

#include "ToolError.h"

#include <fcntl.h>
#include <signal.h>
#include <sys/stat.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <climits>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <utility>

namespace VeltoTool {

namespace fs = std::filesystem;

namespace {

// As the kernel's limit, after which a path is a loop of links.
constexpr int kMaxLinkHops = 40;
// Mode bits an existing output keeps: permissions, set-id and sticky bits.
constexpr mode_t kModeBits = 07777;
// What an ordinary create asks for before the umask applies.
constexpr mode_t kCreateMode = 0666;

// Temporary files that a signal ending the process removes first. Ctrl-C,
// SIGQUIT, SIGTERM, SIGHUP and a file-size limit end the process without
// unwinding, so no destructor would; a signal a command handles itself
// (host's orderly stop) ends it through the destructor instead and is left
// alone, as is one ignored. A command has one or two outputs at a time; one
// past these slots is only not removed.
constexpr int kEndingSignals[] = {SIGHUP, SIGINT, SIGQUIT, SIGTERM, SIGXFSZ};
constexpr int kRemovalSlots = 8;
struct PendingRemoval {
    std::atomic<bool> claimed{false};
    std::atomic<bool> pending{false};
    char path[PATH_MAX] = {};
};
PendingRemoval pendingRemovals[kRemovalSlots];

void removePendingAndEnd(int signal)
{
    for (PendingRemoval& removal : pendingRemovals) {
        if (removal.pending.load()) ::unlink(removal.path);
    }
    // SA_RESETHAND has restored the default action; the signal, blocked while
    // this handler runs, ends the process as it would have on its own.
    ::raise(signal);
}

void removeOnEndingSignals()
{
    for (const int signal : kEndingSignals) {
        struct sigaction current {};
        if (::sigaction(signal, nullptr, &current) != 0 || current.sa_handler != SIG_DFL) continue;
        struct sigaction action {};
        action.sa_handler = removePendingAndEnd;
        action.sa_flags = SA_RESETHAND;
        ::sigemptyset(&action.sa_mask);
        ::sigaction(signal, &action, nullptr);
    }
}

int registerRemoval(const std::string& path)
{
    if (path.size() >= PATH_MAX) return -1;
    for (int slot = 0; slot < kRemovalSlots; ++slot) {
        PendingRemoval& removal = pendingRemovals[slot];
        if (removal.claimed.exchange(true)) continue;
        std::memcpy(removal.path, path.c_str(), path.size() + 1);
        removal.pending.store(true);
        return slot;
    }
    return -1;
}

// mkostemp on `temporary` (a template), registered for removal by a signal:
// the signals wait meanwhile, so that none falls between the two. Returns
// the descriptor, or -1 with errno set.
int createRegistered(std::string& temporary, int& removalSlot)
{
    removeOnEndingSignals();
    sigset_t ending;
    sigset_t previous;
    ::sigemptyset(&ending);
    for (const int signal : kEndingSignals) ::sigaddset(&ending, signal);
    ::pthread_sigmask(SIG_BLOCK, &ending, &previous);
    const int descriptor = ::mkostemp(temporary.data(), O_CLOEXEC);
    const int error = errno;
    removalSlot = descriptor < 0 ? -1 : registerRemoval(temporary);
    ::pthread_sigmask(SIG_SETMASK, &previous, nullptr);
    errno = error;
    return descriptor;
}

void unregisterRemoval(int slot)
{
    if (slot < 0) return;
    pendingRemovals[slot].pending.store(false);
    pendingRemovals[slot].claimed.store(false);
}

// The umask, read without changing it: umask() reports the mask only by
// replacing it, and a file another thread creates meanwhile would get the
// replacement.
mode_t creationMask()
{
    std::ifstream status("/proc/self/status");
    for (std::string line; std::getline(status, line);) {
        if (line.rfind("Umask:", 0) == 0) return static_cast<mode_t>(std::stoul(line.substr(6), nullptr, 8));
    }
    const mode_t mask = ::umask(0);
    ::umask(mask);
    return mask;
}

// Where a write through `path` lands: its links followed, also a last one
// whose target does not exist yet (an ordinary create makes that target).
fs::path resolved(const std::string& path)
{
    fs::path target = path;
    std::error_code error;
    for (int hops = 0; fs::is_symlink(target, error); ++hops) {
        if (hops == kMaxLinkHops) throw ToolError(path + ": " + std::strerror(ELOOP));
        const fs::path link = fs::read_symlink(target, error);
        if (error) break;
        // An absolute link replaces the whole path; a relative one is read from the link's directory.
        target = target.parent_path() / link;
    }
    const fs::path canonical = fs::weakly_canonical(target, error);
    return error ? fs::absolute(target) : canonical;
}

}  // namespace

OutputFile::OutputFile(std::string path, const std::vector<std::string>& inputs)
    : OutputFile(prepare(path, inputs), path)
{
}

OutputFile::OutputFile(Opened opened, std::string path)
    : _path(std::move(path)),
      _target(std::move(opened.target)),
      _temporary(std::move(opened.temporary)),
      _descriptor(opened.descriptor),
      _removalSlot(opened.removalSlot)
{
}

OutputFile::~OutputFile()
{
    if (!_committed && !_temporary.empty()) ::unlink(_temporary.c_str());
    unregisterRemoval(_removalSlot);
    ::close(_descriptor);
}

OutputFile::Opened OutputFile::prepare(const std::string& path, const std::vector<std::string>& inputs)
{
    struct stat status {};
    const bool exists = ::stat(path.c_str(), &status) == 0;
    if (exists && S_ISDIR(status.st_mode)) throw ToolError(path + ": is a directory");
    for (const std::string& input : inputs) {
        if (sameFile(path, input)) {
            throw ToolError(path + ": is the same file as the input " + input + "; write the output elsewhere");
        }
    }
    if (exists && !S_ISREG(status.st_mode)) {
        const int descriptor = ::open(path.c_str(), O_WRONLY | O_CLOEXEC);
        if (descriptor < 0) throw ToolError(path + ": " + std::strerror(errno));
        return {{}, {}, descriptor, -1};
    }
    const fs::path target = resolved(path);
    std::string temporary = (target.parent_path() / ("." + target.filename().string() + ".XXXXXX")).string();
    int removalSlot = -1;
    const int descriptor = createRegistered(temporary, removalSlot);
    if (descriptor < 0) {
        const int error = errno;
        // A missing directory is said as any create says it.
        if (error == ENOENT) throw ToolError(path + ": " + std::strerror(error));
        throw ToolError(path + ": cannot create a file in " + target.parent_path().string() + ": " +
                        std::strerror(error));
    }
    // mkostemp makes the file private (0600).
    if (::fchmod(descriptor, exists ? status.st_mode & kModeBits : kCreateMode & ~creationMask()) != 0) {
        const int error = errno;
        ::unlink(temporary.c_str());
        unregisterRemoval(removalSlot);
        ::close(descriptor);
        throw ToolError(path + ": " + std::strerror(error));
    }
    return {target.string(), std::move(temporary), descriptor, removalSlot};
}

void OutputFile::checkWritten() const
{
    if (_buffer.error() != 0) fail(_buffer.error());
    if (!_stream) fail(EIO);
}

void OutputFile::commit()
{
    if (_committed) return;
    _stream.flush();
    checkWritten();
    if (!_temporary.empty()) {
        // Some file systems (NFS, a full disk with delayed allocation) report
        // a failed write only when the data is forced out.
        if (::fsync(_descriptor) != 0) fail(errno);
        if (::rename(_temporary.c_str(), _target.c_str()) != 0) fail(errno);
    }
    _committed = true;
    unregisterRemoval(std::exchange(_removalSlot, -1));
}

bool OutputFile::sameFile(const std::string& first, const std::string& second)
{
    struct stat firstStatus {};
    struct stat secondStatus {};
    if (::stat(first.c_str(), &firstStatus) == 0 && ::stat(second.c_str(), &secondStatus) == 0) {
        return firstStatus.st_dev == secondStatus.st_dev && firstStatus.st_ino == secondStatus.st_ino;
    }
    return resolved(first) == resolved(second);
}

void OutputFile::fail(int error) const
{
    throw ToolError(_path + ": " + std::strerror(error));
}

}  // namespace VeltoTool
