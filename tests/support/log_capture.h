#pragma once

// Captures Qt log messages (from any thread) while alive, for assertions on exact texts.

#include <QList>
#include <QString>
#include <QtGlobal>

#include <mutex>

namespace zaf::test {

struct LogEntry {
    QtMsgType type;
    QString category;
    QString message;
};

class LogCapture {
public:
    LogCapture();
    ~LogCapture();
    LogCapture(const LogCapture &) = delete;
    LogCapture &operator=(const LogCapture &) = delete;

    QList<LogEntry> entries() const;
    // Messages of one category ("default" is the console log), in order.
    QStringList messages(const QString &category) const;
    // How many entries carry exactly this message, in any category.
    int count(const QString &message) const;
    void clear();

private:
    static void handler(QtMsgType type, const QMessageLogContext &context, const QString &message);
    mutable std::mutex m_mutex;
    QList<LogEntry> m_entries;
    QtMessageHandler m_previous = nullptr;
};

} // namespace zaf::test
