#include "host/watch/folder_watcher.h"

#include "host/host_log.h"
#include "platform/log.h"

#include <QDir>
#include <QFile>
#include <QFileInfo>
#include <QSocketNotifier>

#include <cerrno>
#include <cstring>

#include <sys/inotify.h>
#include <unistd.h>

namespace zaf::host::watch {

namespace {

// The folder's own events: a file finished, and the folder itself going away.
constexpr uint32_t kFolderEvents = IN_CLOSE_WRITE | IN_MOVED_TO | IN_DELETE_SELF | IN_MOVE_SELF | IN_ONLYDIR | IN_EXCL_UNLINK;
// An ancestor's, while the folder is missing: the next folder of the path appearing, and the
// ancestor itself going away.
constexpr uint32_t kAncestorEvents = IN_CREATE | IN_MOVED_TO | IN_DELETE_SELF | IN_MOVE_SELF | IN_ONLYDIR;
// The watch itself has gone (removed, or the file system unmounted) or is to be dropped.
constexpr uint32_t kGoneEvents = IN_DELETE_SELF | IN_MOVE_SELF | IN_IGNORED | IN_UNMOUNT;
// A bound on the steps of one rearm (each step goes one folder deeper, or finds the folder).
constexpr int kMaxRearmSteps = 256;

QString errnoText(int err)
{
    return QString::fromLocal8Bit(std::strerror(err));
}

QString parentOf(const QString &path)
{
    return QFileInfo(path).path();
}

// The folder of the path just below `ancestor`: what the ancestor's watch waits for.
QString nextFolderBelow(const QString &ancestor, const QString &folder)
{
    const QString rest = folder.mid(ancestor == QLatin1String("/") ? 1 : ancestor.size() + 1);
    return QDir(ancestor).filePath(rest.section(QLatin1Char('/'), 0, 0));
}

} // namespace

FolderWatcher::FolderWatcher(QObject *parent) : QObject(parent)
{
}

FolderWatcher::~FolderWatcher()
{
    delete m_notifier;
    if (m_inotify >= 0)
        ::close(m_inotify);
}

bool FolderWatcher::start(const QString &folder, QString *error)
{
    if (m_inotify >= 0) {
        *error = QStringLiteral("the folder watcher was started already");
        return false;
    }
    m_inotify = ::inotify_init1(IN_NONBLOCK | IN_CLOEXEC);
    if (m_inotify < 0) {
        *error = QStringLiteral("cannot watch folders (inotify): %1").arg(errnoText(errno));
        return false;
    }
    m_folder = QDir::cleanPath(QDir(folder).absolutePath());
    m_notifier = new QSocketNotifier(m_inotify, QSocketNotifier::Read);
    connect(m_notifier, &QSocketNotifier::activated, this, &FolderWatcher::readEvents);
    rearm();
    return true;
}

void FolderWatcher::dropAncestorWatch()
{
    if (m_ancestorWatch >= 0)
        ::inotify_rm_watch(m_inotify, m_ancestorWatch);
    m_ancestorWatch = -1;
    m_ancestor.clear();
}

void FolderWatcher::rearm()
{
    const QByteArray folder = QFile::encodeName(m_folder);
    for (int step = 0; step < kMaxRearmSteps; ++step) {
        const int watch = ::inotify_add_watch(m_inotify, folder.constData(), kFolderEvents);
        if (watch >= 0) {
            dropAncestorWatch();
            m_folderWatch = watch;
            m_missingAnnounced = false;
            log::notice(lcHost(), QStringLiteral("watching %1 for finished recordings").arg(m_folder));
            Q_EMIT folderWatched(m_folder);
            return;
        }
        const int err = errno;
        const bool missing = err == ENOENT || err == ENOTDIR;
        if (!missing)
            log::error(lcHost(), QStringLiteral("cannot watch %1: %2; waiting for it to change").arg(m_folder, errnoText(err)));
        QString ancestor = parentOf(m_folder);
        while (!QFileInfo(ancestor).isDir() && ancestor != QLatin1String("/"))
            ancestor = parentOf(ancestor);
        if (ancestor != m_ancestor || m_ancestorWatch < 0) {
            dropAncestorWatch();
            m_ancestorWatch = ::inotify_add_watch(m_inotify, QFile::encodeName(ancestor).constData(), kAncestorEvents);
            if (m_ancestorWatch < 0) {
                log::error(lcHost(), QStringLiteral("cannot watch %1 for %2 to appear: %3").arg(ancestor, m_folder, errnoText(errno)));
                break;
            }
            m_ancestor = ancestor;
        }
        // The next folder may have appeared before the ancestor's watch was in place: look again.
        if (!missing || !QFileInfo::exists(nextFolderBelow(ancestor, m_folder)))
            break;
    }
    if (!m_missingAnnounced) {
        m_missingAnnounced = true;
        log::notice(lcHost(), QStringLiteral("waiting for %1 to appear").arg(m_folder));
        Q_EMIT folderMissing(m_folder);
    }
}

void FolderWatcher::readEvents()
{
    alignas(struct inotify_event) char buffer[64 * 1024];
    for (;;) {
        const ssize_t length = ::read(m_inotify, buffer, sizeof buffer);
        if (length < 0 && errno == EINTR)
            continue;
        if (length < 0) {
            if (errno != EAGAIN)
                log::error(lcHost(), QStringLiteral("cannot read the changes in %1: %2").arg(m_folder, errnoText(errno)));
            return;
        }
        if (length == 0)
            return;
        for (const char *at = buffer; at < buffer + length;) {
            const auto *event = reinterpret_cast<const struct inotify_event *>(at);
            at += sizeof(struct inotify_event) + event->len;
            const uint32_t mask = event->mask;
            if (mask & IN_Q_OVERFLOW) {
                log::error(lcHost(), QStringLiteral("some changes in %1 were missed: the kernel's queue of them overflowed").arg(m_folder));
                continue;
            }
            const QString name = event->len ? QFile::decodeName(event->name) : QString();
            if (event->wd == m_folderWatch && m_folderWatch >= 0) {
                if ((mask & (IN_CLOSE_WRITE | IN_MOVED_TO)) && !(mask & IN_ISDIR) && !name.isEmpty())
                    Q_EMIT fileFinished(m_folder + QLatin1Char('/') + name);
                if (mask & kGoneEvents) {
                    ::inotify_rm_watch(m_inotify, m_folderWatch); // already gone unless moved away
                    m_folderWatch = -1;
                    log::notice(lcHost(), QStringLiteral("%1 went away").arg(m_folder));
                    rearm();
                }
            } else if (event->wd == m_ancestorWatch && m_ancestorWatch >= 0) {
                if (mask & kGoneEvents) {
                    dropAncestorWatch();
                    rearm();
                } else if (QDir(m_ancestor).filePath(name) == nextFolderBelow(m_ancestor, m_folder)) {
                    rearm();
                }
            }
        }
    }
}

} // namespace zaf::host::watch
