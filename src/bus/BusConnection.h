#pragma once

#include <sys/types.h>

#include <atomic>
#include <deque>
#include <functional>
#include <mutex>
#include <string>
#include <thread>

struct sd_bus;

namespace VeltoHost {

// One D-Bus connection and the thread that serves it.
//
// sd-bus is not thread-safe: a connection must be used by one thread at a
// time. Here it is used by exactly one, the connection's own thread, which
// waits in poll() on the bus socket and on an eventfd, and in turn
// dispatches incoming calls (sd_bus_process) and runs the jobs other threads
// posted. Everything that touches the connection after start() is such a job
// or a call handler, so nothing else ever needs a lock around sd-bus.
//
// Jobs run one at a time, in the order they were posted, interleaved with
// incoming calls; a job or handler that takes long holds up the others.
// When the connection to the bus breaks, the failure is logged once, lost()
// turns true, and jobs keep running (their sends fail quietly), so that no
// caller waits forever; the owner decides what a service without its bus does.
class BusConnection {
public:
    // Where to connect: the system bus, the caller's session bus, or a bus
    // address ("unix:path=/run/...").
    struct Address {
        enum class Kind { System, Session, Address };
        Kind kind = Kind::System;
        std::string address;

        static Address system() { return {Kind::System, {}}; }
        static Address session() { return {Kind::Session, {}}; }
        static Address at(std::string address) { return {Kind::Address, std::move(address)}; }
        // "system", "session", or an address ("TRANSPORT:KEY=VALUE,...");
        // raises std::invalid_argument for anything else.
        static Address parse(const std::string& text);
        std::string description() const;
    };

    // Connects; raises std::runtime_error naming the bus when that fails.
    explicit BusConnection(const Address& address);
    // A bare client connection for a caller that serves it on its own
    // thread (ControlClient); raises like the constructor. The caller unrefs it.
    static sd_bus* connect(const Address& address);
    // Stops the thread (running the jobs still queued), flushes what is
    // waiting to be sent and closes the connection.
    ~BusConnection();
    BusConnection(const BusConnection&) = delete;
    BusConnection& operator=(const BusConnection&) = delete;

    // The connection, for the set-up done before start() and for jobs and
    // handlers on the connection's thread; no one else may use it.
    sd_bus* bus() const noexcept { return _bus; }
    // The connection's unique name on the bus (":1.42").
    const std::string& uniqueName() const noexcept { return _uniqueName; }

    // Starts serving on the connection's own thread.
    void start();
    // Ends serving: the jobs already queued run, then the thread ends. Jobs
    // posted later are dropped; call() then runs its job on the caller's
    // thread, one caller at a time. Idempotent.
    void stop();

    // Runs `job` on the connection's thread. Any thread; never waits for the bus.
    // False when the job was dropped because serving has ended.
    bool post(std::function<void()> job);
    // Runs `job` on the connection's thread and waits for it; exceptions it
    // raises reach the caller. Runs at once when called from that thread.
    void call(const std::function<void()>& job);

    bool isCurrent() const noexcept { return std::this_thread::get_id() == _threadId.load(); }
    // True once the connection to the bus has broken; it never comes back.
    bool lost() const noexcept { return _lost.load(); }

private:
    void serve();
    bool runQueuedJobs();
    bool processIncoming();
    // Sleeps until the bus, a posted job or sd-bus's own deadline needs the
    // thread; not at all when messages are already waiting.
    void waitForWork(bool moreWaiting);

    sd_bus* _bus = nullptr;
    std::string _uniqueName;
    std::string _description;
    const int _wakeFd;

    std::thread _thread;
    std::atomic<std::thread::id> _threadId{};
    bool _broken = false;  // connection's thread only
    std::atomic<bool> _lost{false};

    std::mutex _jobsLock;
    // Guarded by _jobsLock.
    std::deque<std::function<void()>> _jobs;
    bool _stopping = false;
    bool _serving = false;

    std::mutex _inlineLock;  // serialises call() once the thread has ended
};

}  // namespace VeltoHost
