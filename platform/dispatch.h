#pragma once

// The main queue and the two global work queues.
//
// The main queue is the Qt event loop of the GUI thread: work queued there runs on a later pass of
// that loop. The global queues are two thread pools that run submitted work concurrently, one at
// background priority and one at default priority. Neither keeps an order between two submissions.

#include <functional>

class QThreadPool;

namespace zaf::dispatch {

enum class Priority { Background, Default };

// Queues fn to run on the main thread on a later pass of its event loop. Callable from any thread.
// Requires a QCoreApplication.
void main(std::function<void()> fn);

// Runs fn on the main thread and waits for it; runs it inline when already on the main thread.
void mainSync(std::function<void()> fn);

// Runs fn on a thread of the global queue of the given priority and returns at once.
void async(Priority priority, std::function<void()> fn);

// The pool behind a global queue.
QThreadPool &globalQueue(Priority priority);
// Waits until the global queue has run everything submitted so far (tests and shutdown); what that
// work wrote is visible afterwards.
void waitForGlobalQueue(Priority priority);

// True on the thread that runs the Qt event loop of the application (the main thread).
bool isMainThread();

} // namespace zaf::dispatch
