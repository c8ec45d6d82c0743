#include "host/watch/desktop_notifier.h"

#include "host/host_log.h"
#include "platform/log.h"

#include <QDBusMessage>
#include <QDBusPendingCallWatcher>
#include <QDBusPendingReply>
#include <QTimer>
#include <QVariantMap>

namespace zaf::host::watch {

namespace {

constexpr char kService[] = "org.freedesktop.Notifications";
constexpr char kPath[] = "/org/freedesktop/Notifications";
constexpr char kSaveType[] = "com.zafrel.activity.SaveToPhotoLibrary";
constexpr char kPublishType[] = "ZafPublishToYouTube";
// The notification comes from the editor: its name, its icon and its desktop entry.
constexpr char kAppName[] = "Zafrel";
constexpr char kAppId[] = "com.zafrel.VideoEditor";
// How long the service may take to answer before the call counts as failed.
constexpr int kAnswerTimeoutMs = 10000;

} // namespace

QString summarizeActivityTypes(const QStringList &activityTypes)
{
    QStringList parts;
    if (activityTypes.contains(QLatin1String(kSaveType)))
        parts << QStringLiteral("Saved to your Videos");
    if (activityTypes.contains(QLatin1String(kPublishType)))
        parts << QStringLiteral("Published to YouTube");
    for (const QString &type : activityTypes) {
        if (type != QLatin1String(kSaveType) && type != QLatin1String(kPublishType)) {
            parts << QStringLiteral("Shared");
            break;
        }
    }
    if (parts.isEmpty())
        return QStringLiteral("Nothing was changed");
    for (qsizetype i = 1; i < parts.size(); ++i)
        parts[i][0] = parts[i][0].toLower();
    const QString last = parts.takeLast();
    return parts.isEmpty() ? last : parts.join(QStringLiteral(", ")) + QStringLiteral(" and ") + last;
}

DesktopNotifier::DesktopNotifier(const QDBusConnection &bus, QObject *parent) : QObject(parent), m_bus(bus)
{
}

void DesktopNotifier::notify(const QString &summary, const QString &body)
{
    if (!m_bus.isConnected()) {
        log::notice(lcHost(), QStringLiteral("no desktop notification (no session bus: %1): %2 - %3")
                                  .arg(m_bus.lastError().message(), summary, body));
        QTimer::singleShot(0, this, [this, summary] { Q_EMIT answered(summary, false); });
        return;
    }
    QDBusMessage call = QDBusMessage::createMethodCall(QLatin1String(kService), QLatin1String(kPath), QLatin1String(kService),
                                                       QStringLiteral("Notify"));
    const QVariantMap hints{{QStringLiteral("desktop-entry"), QLatin1String(kAppId)}};
    call << QLatin1String(kAppName) << uint(0) << QLatin1String(kAppId) << summary << body << QStringList() << hints << int(-1);
    auto *watcher = new QDBusPendingCallWatcher(m_bus.asyncCall(call, kAnswerTimeoutMs), this);
    connect(watcher, &QDBusPendingCallWatcher::finished, this, [this, summary, body](QDBusPendingCallWatcher *finished) {
        finished->deleteLater();
        const QDBusPendingReply<uint> reply = *finished;
        if (reply.isError()) {
            log::notice(lcHost(), QStringLiteral("no desktop notification (%1): %2 - %3").arg(reply.error().message(), summary, body));
            Q_EMIT answered(summary, false);
            return;
        }
        log::notice(lcHost(), QStringLiteral("notified (notification %1): %2 - %3").arg(reply.value()).arg(summary, body));
        Q_EMIT answered(summary, true);
    });
}

} // namespace zaf::host::watch
