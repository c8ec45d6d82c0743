#include "tests/support/log_capture.h"

#include <QLoggingCategory>
#include <QStringList>

#include <atomic>

namespace zaf::test {

namespace {
std::atomic<LogCapture *> g_active{nullptr};
}

LogCapture::LogCapture()
{
    // Debug output of our categories is captured, whatever the environment's filter rules say; Qt's
    // own categories keep their defaults so their chatter stays out of test output.
    QLoggingCategory::setFilterRules(QStringLiteral("zaf.*.debug=true\ndefault.debug=true"));
    g_active.store(this);
    m_previous = qInstallMessageHandler(&LogCapture::handler);
}

LogCapture::~LogCapture()
{
    qInstallMessageHandler(m_previous);
    g_active.store(nullptr);
    QLoggingCategory::setFilterRules(QString());
}

void LogCapture::handler(QtMsgType type, const QMessageLogContext &context, const QString &message)
{
    if (LogCapture *self = g_active.load()) {
        std::lock_guard lock(self->m_mutex);
        self->m_entries.append({type, QString::fromLatin1(context.category ? context.category : "default"), message});
    }
}

QList<LogEntry> LogCapture::entries() const
{
    std::lock_guard lock(m_mutex);
    return m_entries;
}

QStringList LogCapture::messages(const QString &category) const
{
    QStringList out;
    for (const LogEntry &e : entries())
        if (e.category == category)
            out << e.message;
    return out;
}

int LogCapture::count(const QString &message) const
{
    int n = 0;
    for (const LogEntry &e : entries())
        n += e.message == message;
    return n;
}

void LogCapture::clear()
{
    std::lock_guard lock(m_mutex);
    m_entries.clear();
}

} // namespace zaf::test
