#include "bus/BusConnection.h"

#include "platform/log/Log.h"

#include <poll.h>
#include <sys/eventfd.h>
#include <systemd/sd-bus.h>
#include <time.h>
#include <unistd.h>

#include <cerrno>
#include <cstdint>
#include <cstring>
#include <future>
#include <limits>
#include <stdexcept>

namespace VeltoHost {

namespace {

// Incoming messages handled before the queued jobs get their turn again, so
// that a flood of calls cannot starve the signals waiting to go out.
constexpr int kMessagesPerTurn = 64;

const Log& busLog()
{
    static const Log log("BusService");
    return log;
}

std::string errorText(int negativeErrno) { return std::strerror(-negativeErrno); }

std::uint64_t monotonicMicroseconds()
{
    timespec now{};
    ::clock_gettime(CLOCK_MONOTONIC, &now);
    return static_cast<std::uint64_t>(now.tv_sec) * 1'000'000u + static_cast<std::uint64_t>(now.tv_nsec) / 1000u;
}

// poll()'s timeout for sd-bus's absolute deadline (none: wait for ever).
int pollTimeout(sd_bus* bus)
{
    std::uint64_t deadline = 0;
    if (sd_bus_get_timeout(bus, &deadline) < 0 || deadline == std::numeric_limits<std::uint64_t>::max()) return -1;
    const std::uint64_t now = monotonicMicroseconds();
    if (deadline <= now) return 0;
    const std::uint64_t milliseconds = (deadline - now + 999) / 1000;
    return milliseconds > static_cast<std::uint64_t>(std::numeric_limits<int>::max()) ? std::numeric_limits<int>::max()
                                                                                   : static_cast<int>(milliseconds);
}

sd_bus* openBus(const BusConnection::Address& address)
{
    sd_bus* bus = nullptr;
    int result = 0;
    switch (address.kind) {
    case BusConnection::Address::Kind::System: result = sd_bus_open_system(&bus); break;
    case BusConnection::Address::Kind::Session: result = sd_bus_open_user(&bus); break;
    case BusConnection::Address::Kind::Address:
        result = sd_bus_new(&bus);
        if (result >= 0) result = sd_bus_set_address(bus, address.address.c_str());
        if (result >= 0) result = sd_bus_set_bus_client(bus, 1);
        if (result >= 0) result = sd_bus_start(bus);
        break;
    }
    if (result < 0) {
        sd_bus_unref(bus);
        throw std::runtime_error("cannot connect to " + address.description() + ": " + errorText(result));
    }
    return bus;
}

}  // namespace

BusConnection::Address BusConnection::Address::parse(const std::string& text)
{
    if (text == "system") return system();
    if (text == "session") return session();
    // Every D-Bus address starts with its transport: "unix:", "tcp:", ...
    const auto colon = text.find(':');
    if (colon == std::string::npos || colon == 0) {
        throw std::invalid_argument("\"" + text +
                                    "\" is not a bus: give system, session or a D-Bus address such as "
                                    "unix:path=/run/dbus/system_bus_socket");
    }
    return at(text);
}

std::string BusConnection::Address::description() const
{
    switch (kind) {
    case Kind::System: return "the system bus";
    case Kind::Session: return "the session bus";
    case Kind::Address: return "the bus at " + address;
    }
    return "the bus";
}

sd_bus* BusConnection::connect(const Address& address) { return openBus(address); }

BusConnection::BusConnection(const Address& address)
    : _description(address.description()), _wakeFd(::eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK))
{
    if (_wakeFd < 0) throw std::runtime_error(std::string("cannot create an eventfd: ") + std::strerror(errno));
    try {
        _bus = openBus(address);
    } catch (...) {
        ::close(_wakeFd);
        throw;
    }
    const char* unique = nullptr;
    if (sd_bus_get_unique_name(_bus, &unique) >= 0 && unique) _uniqueName = unique;
}

BusConnection::~BusConnection()
{
    stop();
    sd_bus_flush_close_unref(_bus);
    ::close(_wakeFd);
}

void BusConnection::start()
{
    std::lock_guard guard(_jobsLock);
    if (_serving || _stopping) return;
    _serving = true;
    _thread = std::thread([this] { serve(); });
}

void BusConnection::stop()
{
    {
        std::lock_guard guard(_jobsLock);
        _stopping = true;
    }
    const std::uint64_t one = 1;
    [[maybe_unused]] const ssize_t written = ::write(_wakeFd, &one, sizeof one);
    if (_thread.joinable() && std::this_thread::get_id() != _thread.get_id()) _thread.join();
}

bool BusConnection::post(std::function<void()> job)
{
    {
        std::lock_guard guard(_jobsLock);
        if (!_serving || _stopping) return false;
        _jobs.push_back(std::move(job));
    }
    const std::uint64_t one = 1;
    [[maybe_unused]] const ssize_t written = ::write(_wakeFd, &one, sizeof one);
    return true;
}

void BusConnection::call(const std::function<void()>& job)
{
    if (isCurrent()) {
        job();
        return;
    }
    auto done = std::make_shared<std::promise<void>>();
    std::future<void> finished = done->get_future();
    bool queued = false;
    {
        std::lock_guard guard(_jobsLock);
        // While the thread serves, even a stopping one, it runs what is queued
        // before it ends; once it no longer serves, the caller runs the job.
        if (_serving) {
            _jobs.push_back([&job, done] {
                try {
                    job();
                    done->set_value();
                } catch (...) {
                    done->set_exception(std::current_exception());
                }
            });
            queued = true;
        }
    }
    if (!queued) {
        std::lock_guard guard(_inlineLock);
        job();
        return;
    }
    const std::uint64_t one = 1;
    [[maybe_unused]] const ssize_t written = ::write(_wakeFd, &one, sizeof one);
    finished.get();
}

void BusConnection::serve()
{
    _threadId = std::this_thread::get_id();
    while (runQueuedJobs()) {
        const bool moreWaiting = processIncoming();
        waitForWork(moreWaiting);
    }
    _threadId = std::thread::id();
}

bool BusConnection::runQueuedJobs()
{
    std::deque<std::function<void()>> jobs;
    {
        std::lock_guard guard(_jobsLock);
        if (_jobs.empty() && _stopping) {
            _serving = false;
            return false;
        }
        jobs.swap(_jobs);
    }
    for (auto& job : jobs) {
        try {
            job();
        } catch (const std::exception& error) {
            busLog().error("bus job failed: %s", error.what());
        } catch (...) {
            busLog().error("bus job failed");
        }
    }
    return true;
}

bool BusConnection::processIncoming()
{
    if (_broken) return false;
    for (int handled = 0; handled < kMessagesPerTurn; ++handled) {
        const int result = sd_bus_process(_bus, nullptr);
        if (result == 0) return false;
        if (result < 0) {
            _broken = true;
            _lost = true;
            busLog().error("connection to %s lost: %s; the service no longer answers", _description,
                           errorText(result));
            return false;
        }
    }
    return true;  // more may be waiting
}

void BusConnection::waitForWork(bool moreWaiting)
{
    pollfd fds[2] = {{_wakeFd, POLLIN, 0}, {-1, 0, 0}};
    int timeout = -1;
    if (!_broken) {
        const int events = sd_bus_get_events(_bus);
        const int fd = sd_bus_get_fd(_bus);
        if (events >= 0 && fd >= 0) {
            fds[1] = {fd, static_cast<short>(events), 0};
            timeout = pollTimeout(_bus);
        }
    }
    {
        std::lock_guard guard(_jobsLock);
        if (moreWaiting || !_jobs.empty() || _stopping) timeout = 0;
    }
    const int ready = ::poll(fds, fds[1].fd >= 0 ? 2 : 1, timeout);
    if (ready > 0 && (fds[0].revents & POLLIN)) {
        std::uint64_t count = 0;
        [[maybe_unused]] const ssize_t read = ::read(_wakeFd, &count, sizeof count);
    }
}

}  // namespace VeltoHost
