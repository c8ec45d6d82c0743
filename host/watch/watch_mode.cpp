#include "host/watch/watch_mode.h"

#include "host/extension_session.h"
#include "host/host_log.h"
#include "host/private_clone.h"
#include "host/watch/desktop_notifier.h"
#include "host/watch/folder_watcher.h"
#include "host/watch/movie_check.h"
#include "host/watch/termination_signals.h"
#include "platform/dispatch.h"
#include "platform/files/user_folders.h"
#include "platform/log.h"

#include <QCoreApplication>
#include <QDir>
#include <QFileInfo>
#include <QTimer>

#include <cstring>

namespace zaf::host::watch {

namespace {

// How long the editor may take to exit once its channel is closed without a report, and once its
// view has been removed (it empties its temporary directory first): as for `zaf-host --movie`.
constexpr int kExitAfterCloseMs = 10000;
constexpr int kExitAfterRemoveMs = 60000;

QString nameOf(const QString &path)
{
    return QFileInfo(path).fileName();
}

QString canonical(const QString &path)
{
    const QString resolved = QFileInfo(path).canonicalFilePath();
    return resolved.isEmpty() ? QDir::cleanPath(QDir(path).absolutePath()) : resolved;
}

} // namespace

QString defaultWatchFolder()
{
    return QDir(zaf::files::videosFolder()).filePath(QStringLiteral("Screencasts"));
}

std::optional<QString> watchFolderProblem(const QString &folder, bool givenByTheUser)
{
    if (givenByTheUser && !QFileInfo(folder).isDir())
        return QStringLiteral("the folder %1 does not exist").arg(folder);
    const QString library = zaf::files::videoLibraryFolder();
    if (canonical(folder) == canonical(library))
        return QStringLiteral("%1 is the video library the editor saves into: every save would be offered again; watch the folder "
                              "your recorder saves into (by default %2)").arg(folder, defaultWatchFolder());
    return std::nullopt;
}

// One file offered to the editor, from the start of its editor to its end. The members go in
// reverse order: the deadline, then the session (which ends an editor still running), then the
// clone the editor worked on.
struct WatchMode::Offer {
    QString source; // the recorder's file
    std::unique_ptr<PrivateClone> clone;
    std::unique_ptr<ExtensionSession> session;
    QTimer deadline;
    QStringList activityTypes;
    bool reported = false;
    bool ending = false;
};

// What the worker found out about one file.
struct WatchMode::Examination {
    QString path;
    bool offer = false;
    bool failed = false; // not ignored but an error: the clone could not be made
    QString reason;      // why it is not offered
    FileIdentity identity;
    std::unique_ptr<PrivateClone> clone;
};

WatchMode::WatchMode(WatchSettings settings, QObject *parent) : QObject(parent), m_settings(std::move(settings))
{
    m_worker.setMaxThreadCount(1);
    m_worker.setObjectName(QStringLiteral("zaf.host.watch"));
}

WatchMode::~WatchMode()
{
    stop();
}

bool WatchMode::start(QString *error)
{
    m_notifier = new DesktopNotifier(QDBusConnection::sessionBus(), this);
    m_watcher = new FolderWatcher(this);
    connect(m_watcher, &FolderWatcher::fileFinished, this, &WatchMode::fileFinished);
    return m_watcher->start(m_settings.folder, error);
}

void WatchMode::stop()
{
    if (m_stopping)
        return;
    m_stopping = true;
    if (const qsizetype dropped = m_queue.clear())
        log::notice(lcHost(), QStringLiteral("stopping: %1 recording(s) waiting for the editor dropped").arg(dropped));
    m_worker.waitForDone();
    if (m_offer) {
        log::notice(lcHost(), QStringLiteral("stopping: ending the editor open on %1").arg(m_offer->source));
        m_offer.reset();
    }
    delete m_watcher;
    m_watcher = nullptr;
}

void WatchMode::fileFinished(const QString &path)
{
    if (m_stopping)
        return;
    if (isPartialName(nameOf(path))) {
        log::notice(lcHost(), QStringLiteral("ignored %1: its name is that of a hidden file or one still being written").arg(path));
        return;
    }
    if (!m_queue.push(path)) {
        log::notice(lcHost(), QStringLiteral("%1 is waiting for the editor already").arg(path));
        return;
    }
    if (isBusy())
        log::notice(lcHost(), QStringLiteral("queued %1 (%2 waiting): an editor is open").arg(path).arg(m_queue.size()));
    offerNext();
}

void WatchMode::offerNext()
{
    if (m_stopping || isBusy())
        return;
    const std::optional<QString> path = m_queue.pop();
    if (!path)
        return;
    m_examining = true;
    // The worker thread: the check and the clone, blocking file work.
    dispatch::asyncOn(m_worker, [this, path = *path, offered = m_offered, cacheDirectory = m_settings.cacheDirectory] {
        auto result = std::make_shared<Examination>();
        result->path = path;
        const MovieCheck check = checkMovieFile(path);
        result->identity = check.identity;
        if (check.verdict != MovieVerdict::Movie) {
            result->reason = check.verdict == MovieVerdict::NotMpeg4 ? QStringLiteral("not an MPEG-4 movie: %1").arg(check.reason)
                                                                     : check.reason;
        } else if (offered.contains(check.identity)) {
            result->reason = QStringLiteral("offered already, unchanged since");
        } else {
            result->clone = PrivateClone::make(path, cacheDirectory, &result->reason);
            result->failed = !result->clone;
            result->offer = !result->failed;
        }
        // Dropped with its clone when the watch mode has gone first.
        dispatch::onThreadOf(this, [this, result] { examined(std::move(*result)); });
    });
}

void WatchMode::examined(Examination examination)
{
    m_examining = false;
    if (m_stopping)
        return;
    if (examination.failed) {
        log::error(lcHost(), QStringLiteral("cannot offer %1: %2").arg(examination.path, examination.reason));
        notifyFailure(examination.path);
    } else if (!examination.offer) {
        log::notice(lcHost(), QStringLiteral("ignored %1: %2").arg(examination.path, examination.reason));
    } else {
        openEditor(examination.path, examination.identity, std::move(examination.clone));
    }
    offerNext();
}

void WatchMode::openEditor(const QString &source, const FileIdentity &identity, std::unique_ptr<PrivateClone> clone)
{
    auto offer = std::make_unique<Offer>();
    offer->source = source;
    offer->clone = std::move(clone);
    RecordingDetails details = m_settings.details;
    details.moviePath = offer->clone->path();
    QString problem;
    const std::optional<QList<InputItem>> items = makeInputItems(details, &problem);
    offer->session = std::make_unique<ExtensionSession>();
    if (!items || !offer->session->start(m_settings.extension, *items, &problem)) {
        log::error(lcHost(), QStringLiteral("cannot open the editor on %1: %2").arg(source, problem));
        notifyFailure(source);
        return;
    }
    Offer *const o = offer.get();
    ExtensionSession *const session = o->session.get();
    o->deadline.setSingleShot(true);
    auto awaitExit = [o](int milliseconds) {
        if (!o->deadline.isActive())
            o->deadline.start(milliseconds);
    };
    // An offer ends after its slot has returned: the session is never deleted inside its own signal.
    auto end = [this, o] {
        if (o->ending)
            return;
        o->ending = true;
        QMetaObject::invokeMethod(this, [this, o] { endOffer(o); }, Qt::QueuedConnection);
    };
    connect(session, &ExtensionSession::activityTypesReported, this, [o, session, awaitExit](const QStringList &types) {
        for (const QString &type : types) {
            if (!o->activityTypes.contains(type))
                o->activityTypes << type;
        }
        if (!o->reported) {
            o->reported = true;
            session->removeView();
            awaitExit(kExitAfterRemoveMs);
        }
    });
    connect(session, &ExtensionSession::requestRejected, this, [o, session, awaitExit](const QString &message) {
        log::error(lcHost(), QStringLiteral("the editor refused %1: %2").arg(o->source, message));
        session->removeView();
        awaitExit(kExitAfterRemoveMs);
    });
    connect(session, &ExtensionSession::channelClosed, this, [o, awaitExit] {
        if (!o->reported)
            awaitExit(kExitAfterCloseMs);
    });
    connect(session, &ExtensionSession::finished, this, [o, end](int exitCode, bool crashed) {
        o->deadline.stop();
        if (crashed)
            log::error(lcHost(), exitCode > 128 ? QStringLiteral("the editor on %1 died (signal %2)").arg(o->source).arg(exitCode - 128)
                                                : QStringLiteral("the editor on %1 failed (exit status %2)").arg(o->source).arg(exitCode));
        end();
    });
    connect(&o->deadline, &QTimer::timeout, this, [o, end] {
        log::error(lcHost(), QStringLiteral("the editor on %1 did not exit; ending it").arg(o->source));
        end();
    });
    log::notice(lcHost(), QStringLiteral("offered %1 to the editor, on its copy %2").arg(source, o->clone->path()));
    // Remembered once the editor is open: a file whose editor could not start may come again.
    m_offered.remember(identity);
    m_offer = std::move(offer);
}

void WatchMode::endOffer(Offer *offer)
{
    if (!m_offer || m_offer.get() != offer)
        return; // ended by stop()
    {
        const std::unique_ptr<Offer> ended = std::move(m_offer);
        if (ended->reported) {
            log::notice(lcHost(), QStringLiteral("the editor on %1 ended: [%2]").arg(ended->source, ended->activityTypes.join(QStringLiteral(", "))));
            m_notifier->notify(summarizeActivityTypes(ended->activityTypes), nameOf(ended->source));
        } else {
            log::error(lcHost(), QStringLiteral("the editor on %1 ended without saying what the user did").arg(ended->source));
            notifyFailure(ended->source);
        }
        // `ended` goes here: the session (an editor still running is ended), then the clone.
    }
    offerNext();
}

void WatchMode::notifyFailure(const QString &source)
{
    m_notifier->notify(QStringLiteral("The editor could not finish"), nameOf(source));
}

int runWatchMode(const WatchSettings &settings)
{
    TerminationSignals termination;
    if (!termination.isInstalled())
        log::error(lcHost(), QStringLiteral("cannot catch SIGTERM and SIGINT: an open editor would be left when zaf-host is stopped"));
    WatchMode mode(settings);
    QObject::connect(&termination, &TerminationSignals::received, &mode, [&mode](int signalNumber) {
        log::notice(lcHost(), QStringLiteral("%1: stopping").arg(QString::fromLocal8Bit(::strsignal(signalNumber))));
        mode.stop();
        QCoreApplication::exit(0);
    });
    QString problem;
    if (!mode.start(&problem)) {
        log::error(lcHost(), problem);
        return 1;
    }
    return QCoreApplication::exec();
}

} // namespace zaf::host::watch
