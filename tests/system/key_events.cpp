// Prints the key presses and releases of an evdev keyboard found by its name,
// one "KEY_NAME 1" (press) or "KEY_NAME 0" (release) per line, as
// tests/system/expected_keys prints what the daemon should send.
//
//   key_events [--name NAME] [--wait SECONDS] [--quiet SECONDS]
//
// NAME defaults to "VeltoTouch keys", the daemon's virtual keyboard. The node
// is looked for among /dev/input/event* for at most --wait seconds (default
// 10); once it is open, "key_events: reading /dev/input/eventN" goes to
// standard error. Reads until SIGTERM or SIGINT, or until --quiet seconds
// pass without an event (default: no limit). SIGUSR1 prints a line "--"
// after every event that had arrived by then, so that a test can tell the
// keys of one run from those of the next. Key repeats (value 2, the input
// core's auto-repeat) are not keys the daemon sent and are left out; a
// SYN_DROPPED (the kernel's buffer overflowed, events were lost) is printed
// as a line "SYN_DROPPED", so that the comparison fails.
#include <libevdev/libevdev.h>

#include <fcntl.h>
#include <glob.h>
#include <poll.h>
#include <signal.h>
#include <sys/signalfd.h>
#include <unistd.h>

#include <cerrno>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <string>
#include <thread>

namespace {

// The open node whose device name is `name`, or -1.
int openByName(const std::string& name, libevdev*& device)
{
    glob_t nodes{};
    if (glob("/dev/input/event*", 0, nullptr, &nodes) != 0) return -1;
    int found = -1;
    for (std::size_t i = 0; i < nodes.gl_pathc && found < 0; ++i) {
        const int fd = open(nodes.gl_pathv[i], O_RDONLY | O_NONBLOCK | O_CLOEXEC);
        if (fd < 0) continue;
        libevdev* candidate = nullptr;
        if (libevdev_new_from_fd(fd, &candidate) == 0 && name == libevdev_get_name(candidate)) {
            found = fd;
            device = candidate;
            std::fprintf(stderr, "key_events: reading %s\n", nodes.gl_pathv[i]);
            break;
        }
        if (candidate) libevdev_free(candidate);
        close(fd);
    }
    globfree(&nodes);
    return found;
}

void print(const input_event& event)
{
    if (event.type == EV_SYN && event.code == SYN_DROPPED) {
        std::printf("SYN_DROPPED\n");
    } else if (event.type == EV_KEY && (event.value == 0 || event.value == 1)) {
        const char* name = libevdev_event_code_get_name(EV_KEY, event.code);
        if (name) {
            std::printf("%s %d\n", name, event.value);
        } else {
            std::printf("key %u %d\n", event.code, event.value);
        }
    }
}

// Prints every event waiting; false when the device is gone or failed.
bool drain(libevdev* device, bool& sawAny)
{
    for (;;) {
        input_event event;
        int rc = libevdev_next_event(device, LIBEVDEV_READ_FLAG_NORMAL, &event);
        if (rc == LIBEVDEV_READ_STATUS_SYNC) {
            // The kernel dropped events; say so, then catch up as libevdev asks.
            print(input_event{{}, EV_SYN, SYN_DROPPED, 0});
            while (rc == LIBEVDEV_READ_STATUS_SYNC) {
                rc = libevdev_next_event(device, LIBEVDEV_READ_FLAG_SYNC, &event);
            }
            continue;
        }
        if (rc == -EAGAIN) break;
        if (rc != LIBEVDEV_READ_STATUS_SUCCESS) {
            std::fflush(stdout);
            return false;
        }
        sawAny = true;
        print(event);
    }
    std::fflush(stdout);
    return true;
}

int usage()
{
    std::fprintf(stderr, "usage: key_events [--name NAME] [--wait SECONDS] [--quiet SECONDS]\n");
    return 2;
}

}  // namespace

int main(int argc, char** argv)
{
    std::string name = "VeltoTouch keys";
    double waitSeconds = 10;
    double quietSeconds = 0;
    for (int i = 1; i < argc; ++i) {
        const std::string argument = argv[i];
        if (i + 1 >= argc) return usage();
        if (argument == "--name") {
            name = argv[++i];
        } else if (argument == "--wait") {
            waitSeconds = std::atof(argv[++i]);
        } else if (argument == "--quiet") {
            quietSeconds = std::atof(argv[++i]);
        } else {
            return usage();
        }
    }

    // Signals arrive through a descriptor, between reads, never inside one.
    sigset_t signals;
    sigemptyset(&signals);
    sigaddset(&signals, SIGTERM);
    sigaddset(&signals, SIGINT);
    sigaddset(&signals, SIGUSR1);
    sigprocmask(SIG_BLOCK, &signals, nullptr);
    const int signalFd = signalfd(-1, &signals, SFD_CLOEXEC);
    if (signalFd < 0) {
        std::perror("key_events: signalfd");
        return 1;
    }

    libevdev* device = nullptr;
    int fd = -1;
    const auto giveUp = std::chrono::steady_clock::now() + std::chrono::duration<double>(waitSeconds);
    while ((fd = openByName(name, device)) < 0) {
        if (std::chrono::steady_clock::now() >= giveUp) {
            std::fprintf(stderr, "key_events: no input device named \"%s\" within %g s\n", name.c_str(), waitSeconds);
            return 1;
        }
        std::this_thread::sleep_for(std::chrono::milliseconds(50));
    }

    pollfd descriptors[2] = {{fd, POLLIN, 0}, {signalFd, POLLIN, 0}};
    const int timeout = quietSeconds > 0 ? static_cast<int>(quietSeconds * 1000) : -1;
    for (;;) {
        const int ready = poll(descriptors, 2, timeout);
        if (ready < 0 && errno == EINTR) continue;
        if (ready < 0) {
            std::perror("key_events: poll");
            return 1;
        }
        bool sawAny = false;
        if (!drain(device, sawAny)) {
            std::fprintf(stderr, "key_events: the device went away\n");
            return 1;
        }
        if (ready == 0) return 0;  // quiet for long enough
        if (descriptors[1].revents & POLLIN) {
            signalfd_siginfo info;
            if (read(signalFd, &info, sizeof info) != static_cast<ssize_t>(sizeof info)) continue;
            if (info.ssi_signo == SIGUSR1) {
                std::printf("--\n");
                std::fflush(stdout);
            } else {
                return 0;
            }
        }
    }
}
