#pragma once

// What `zaf-host --watch` tells the user after an editor has ended: a desktop notification through
// the freedesktop notification service (org.freedesktop.Notifications on the session bus, its
// Notify method), sent without waiting for the answer. Without a session bus or a notification
// service, the notification is logged instead and nothing else happens: it never blocks and never
// fails the caller.
//
// Threads: a DesktopNotifier lives on the thread that created it, which runs a Qt event loop (the
// main thread); notify() is called there and answered() is emitted there.

#include <QDBusConnection>
#include <QObject>
#include <QString>
#include <QStringList>

namespace zaf::host::watch {

// The summary of a notification from the activity types an editor reported: "Saved to your Videos"
// for the save to the video library, "Published to YouTube" for publishing, "Shared" for any other
// activity, joined into one sentence when there are several ("Saved to your Videos and shared");
// "Nothing was changed" when there are none.
QString summarizeActivityTypes(const QStringList &activityTypes);

class DesktopNotifier : public QObject {
    Q_OBJECT
public:
    // Notifies through `bus` (the session bus unless a test gives another).
    explicit DesktopNotifier(const QDBusConnection &bus = QDBusConnection::sessionBus(), QObject *parent = nullptr);

    // Sends a notification from the editor (its name and icon) and returns at once. The service's
    // answer, or why there is none, is logged under "zaf.host" when it comes.
    void notify(const QString &summary, const QString &body);

Q_SIGNALS:
    // The notifier's thread: the answer to one notify(): `shown` when the service took it, false
    // when there is no bus or no service, or the service refused it.
    void answered(const QString &summary, bool shown);

private:
    QDBusConnection m_bus;
};

} // namespace zaf::host::watch
