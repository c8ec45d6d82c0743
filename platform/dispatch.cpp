#include "platform/dispatch.h"

#include <QCoreApplication>
#include <QMetaObject>
#include <QThread>
#include <QThreadPool>

namespace zaf::dispatch {

namespace {

// Qt is not built with ThreadSanitizer, so the locking inside its thread pools and event queue is
// invisible to it, and every hand-over through them would read as a data race. The hand-overs are
// declared instead: the submitting side releases a sync point after the task is built, the task
// acquires it before it touches anything it captured, and releases it again when done (for the
// side that waits for the pool). Without the sanitizer these compile to nothing.
#if defined(__SANITIZE_THREAD__)
extern "C" void __tsan_acquire(void *address);
extern "C" void __tsan_release(void *address);
char g_handOff;
void handOffRelease() { __tsan_release(&g_handOff); }
void handOffAcquire() { __tsan_acquire(&g_handOff); }
#else
void handOffRelease() {}
void handOffAcquire() {}
#endif

std::function<void()> handedOff(std::function<void()> fn)
{
    std::function<void()> task = [fn = std::move(fn)] {
        handOffAcquire();
        fn();
        handOffRelease();
    };
    handOffRelease();
    return task;
}

QThreadPool &makePool(QThread::Priority priority)
{
    // Function-local statics: built on first use, safe under concurrent first calls, and waited
    // for (QThreadPool's destructor) when the process exits normally.
    static QThreadPool background;
    static QThreadPool normal;
    static std::once_flag once;
    std::call_once(once, [] {
        background.setThreadPriority(QThread::LowPriority);
        background.setObjectName(QStringLiteral("zaf.global.background"));
        normal.setObjectName(QStringLiteral("zaf.global.default"));
        // Work items may block on file I/O; allow more threads than cores.
        background.setMaxThreadCount(qMax(4, QThread::idealThreadCount()));
        normal.setMaxThreadCount(qMax(4, QThread::idealThreadCount()));
    });
    return priority == QThread::LowPriority ? background : normal;
}

} // namespace

void main(std::function<void()> fn)
{
    QCoreApplication *app = QCoreApplication::instance();
    Q_ASSERT_X(app, "zaf::dispatch::main", "needs a QCoreApplication");
    if (!app)
        return;
    QMetaObject::invokeMethod(app, handedOff(std::move(fn)), Qt::QueuedConnection);
}

void onThreadOf(QObject *context, std::function<void()> fn)
{
    if (context)
        QMetaObject::invokeMethod(context, handedOff(std::move(fn)), Qt::QueuedConnection);
}

void mainSync(std::function<void()> fn)
{
    if (isMainThread()) {
        fn();
        return;
    }
    QCoreApplication *app = QCoreApplication::instance();
    Q_ASSERT_X(app, "zaf::dispatch::mainSync", "needs a QCoreApplication");
    if (!app)
        return;
    QMetaObject::invokeMethod(app, handedOff(std::move(fn)), Qt::BlockingQueuedConnection);
    handOffAcquire();
}

QThreadPool &globalQueue(Priority priority)
{
    return makePool(priority == Priority::Background ? QThread::LowPriority : QThread::NormalPriority);
}

void async(Priority priority, std::function<void()> fn)
{
    asyncOn(globalQueue(priority), std::move(fn));
}

void asyncOn(QThreadPool &pool, std::function<void()> fn)
{
    pool.start(handedOff(std::move(fn)));
}

void waitForGlobalQueue(Priority priority)
{
    globalQueue(priority).waitForDone();
    handOffAcquire();
}

bool isMainThread()
{
    QCoreApplication *app = QCoreApplication::instance();
    return app && QThread::currentThread() == app->thread();
}

std::shared_ptr<MainGate> MainGate::create()
{
    return std::shared_ptr<MainGate>(new MainGate);
}

bool MainGate::runSync(std::function<void()> fn)
{
    if (isMainThread()) {
        // close() runs on this thread too, so the gate cannot close while fn runs.
        if (isClosed())
            return false;
        fn();
        return true;
    }
    if (!QCoreApplication::instance())
        return false;
    // What became of this one hop; guarded by the gate's mutex.
    struct Hop {
        bool ran = false;
        bool over = false;
    };
    auto hop = std::make_shared<Hop>();
    main([self = shared_from_this(), hop, fn = std::move(fn)] {
        if (self->isClosed()) {
            std::lock_guard lock(self->m_mutex);
            hop->over = true;
        } else {
            fn();
            std::lock_guard lock(self->m_mutex);
            hop->ran = hop->over = true;
        }
        self->m_changed.notify_all();
    });
    std::unique_lock lock(m_mutex);
    m_changed.wait(lock, [&] { return hop->over || m_closed; });
    return hop->ran;
}

void MainGate::close()
{
    {
        std::lock_guard lock(m_mutex);
        m_closed = true;
    }
    m_changed.notify_all();
}

bool MainGate::isClosed() const
{
    std::lock_guard lock(m_mutex);
    return m_closed;
}

} // namespace zaf::dispatch
