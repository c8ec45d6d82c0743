#include "platform/log.h"

#include <QDebug>

namespace zaf::log {

void info(const QLoggingCategory &category, const QString &message)
{
    qCDebug(category).noquote() << message;
}

void notice(const QLoggingCategory &category, const QString &message)
{
    qCInfo(category).noquote() << message;
}

void error(const QLoggingCategory &category, const QString &message)
{
    qCWarning(category).noquote() << message;
}

void console(const QString &message)
{
    qWarning().noquote() << message;
}

void hideInformationalEntriesByDefault()
{
    if (qEnvironmentVariableIsEmpty("QT_LOGGING_RULES"))
        QLoggingCategory::setFilterRules(QStringLiteral("zaf.*.debug=false"));
}

} // namespace zaf::log
