#include "platform/dispatch.h"

#include <QCoreApplication>
#include <QMetaObject>
#include <QThread>
#include <QThreadPool>

namespace zaf::dispatch {

namespace {

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
    QMetaObject::invokeMethod(app, std::move(fn), Qt::QueuedConnection);
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
    QMetaObject::invokeMethod(app, std::move(fn), Qt::BlockingQueuedConnection);
}

QThreadPool &globalQueue(Priority priority)
{
    return makePool(priority == Priority::Background ? QThread::LowPriority : QThread::NormalPriority);
}

void async(Priority priority, std::function<void()> fn)
{
    globalQueue(priority).start(std::move(fn));
}

bool isMainThread()
{
    QCoreApplication *app = QCoreApplication::instance();
    return app && QThread::currentThread() == app->thread();
}

} // namespace zaf::dispatch
