#pragma once

// The main queue and the two global work queues.
//
// The main queue is the Qt event loop of the GUI thread: work queued there runs on a later pass of
// that loop. The global queues are two thread pools that run submitted work concurrently, one at
// background priority and one at default priority. Neither keeps an order between two submissions.

#include <condition_variable>
#include <functional>
#include <memory>
#include <mutex>

class QObject;
class QThreadPool;

namespace zaf::dispatch {

enum class Priority { Background, Default };

// Queues fn to run on the main thread on a later pass of its event loop. Callable from any thread.
// Requires a QCoreApplication.
void main(std::function<void()> fn);

// Queues fn to run on the thread of `context` on a later pass of its event loop, unless `context`
// is destroyed first. Callable from any thread.
void onThreadOf(QObject *context, std::function<void()> fn);

// Runs fn on the main thread and waits for it; runs it inline when already on the main thread.
void mainSync(std::function<void()> fn);

// Runs fn on a thread of the global queue of the given priority and returns at once.
void async(Priority priority, std::function<void()> fn);

// Runs fn on a thread of `pool`, a queue of the caller's own (a serial one, say), with the same
// hand-over to it as the global queues, and returns at once.
void asyncOn(QThreadPool &pool, std::function<void()> fn);

// The pool behind a global queue.
QThreadPool &globalQueue(Priority priority);
// Waits until the global queue has run everything submitted so far (tests and shutdown); what that
// work wrote is visible afterwards.
void waitForGlobalQueue(Priority priority);

// True on the thread that runs the Qt event loop of the application (the main thread).
bool isMainThread();

// A synchronous hop to the main thread that its owner can call off. An object of the main thread
// whose workers hop to it with mainSync cannot wait for those workers (the worker may be blocked
// in its hop while the main thread waits for it). Workers hop through the object's gate instead;
// the object closes the gate as it goes away. From then on no hop runs its work, and a worker
// waiting for its hop returns at once, so the owner may then wait for its workers.
class MainGate : public std::enable_shared_from_this<MainGate> {
public:
    static std::shared_ptr<MainGate> create();

    // Any thread. Runs fn on the main thread and waits until it has run (inline on the main
    // thread), unless the gate is closed first. True when fn ran, false when the gate was closed
    // before it could (fn then never runs) or there is no application.
    bool runSync(std::function<void()> fn);
    // Main thread. Calls off every hop that has not run yet and every later one.
    void close();
    bool isClosed() const;

private:
    MainGate() = default;
    mutable std::mutex m_mutex;
    std::condition_variable m_changed;
    bool m_closed = false;
};

} // namespace zaf::dispatch
