#pragma once

// `zaf-host --watch`: offers the editor each movie a recorder finishes in a folder, for recorders
// that cannot start the editor themselves.
//
// The flow of one file:
//   1. FolderWatcher reports it finished (closed after writing, or renamed into the folder).
//   2. A name given to files still being written (isPartialName) is ignored at once.
//   3. It joins the OfferQueue. Only one editor is open at a time: the others wait, in order.
//   4. When nothing is open, a worker thread checks the file (checkMovieFile: a complete MPEG-4 or
//      QuickTime movie), looks its version up among the files offered already (OfferedFiles), and
//      makes its private clone (PrivateClone), so that the editor's save, which removes the movie it
//      was handed, never removes or changes the recorder's file.
//   5. The editor is started on the clone (ExtensionSession), with the editor's own name and
//      identifier unless others were given. Its report ends it, as `zaf-host --movie` does.
//   6. When it has ended, a desktop notification says what was done (DesktopNotifier), the clone goes,
//      and the next file in the queue is taken.
// Every decision is logged under "zaf.host" (offered, ignored and why, queued, dropped).
//
// Threads: a WatchMode lives on the main thread, which runs the Qt event loop; its methods are
// called there and every callback of its parts arrives there. The check and the clone of step 4
// run on a worker thread of its own (one at a time), whose result comes back to the main thread;
// stop() and the destructor wait for it.

#include "host/input_items.h"
#include "host/watch/offer_queue.h"

#include <QObject>
#include <QString>
#include <QThreadPool>

#include <memory>
#include <optional>

namespace zaf::host {
class PrivateClone;
}

namespace zaf::host::watch {

class DesktopNotifier;
class FolderWatcher;

struct WatchSettings {
    QString folder;           // the watched folder (absolute)
    QString extension;        // the editor extension's program
    RecordingDetails details; // what every offer hands the editor, all but the movie's path
    QString cacheDirectory;   // where the private clones' folders go
};

// The desktop's screencast folder, `$(xdg-user-dir VIDEOS)/Screencasts` (files::videosFolder()).
QString defaultWatchFolder();

// Why `folder` cannot be watched, or nullopt when it can. A folder the user named must be an existing
// folder; the default one may be missing (it is waited for, as the desktop's recorder makes it on its
// first recording). Neither may be the video library the editor saves into
// (files::videoLibraryFolder()): each save would be offered again.
std::optional<QString> watchFolderProblem(const QString &folder, bool givenByTheUser);

class WatchMode : public QObject {
    Q_OBJECT
public:
    explicit WatchMode(WatchSettings settings, QObject *parent = nullptr);
    // stop().
    ~WatchMode() override;

    // Starts watching the folder (or waiting for it). False, with `error` filled, when the folder
    // cannot be watched at all (inotify cannot be had).
    bool start(QString *error);
    // Ends for good, blocking the main thread while it does: the waiting files are dropped (logged),
    // a check or clone in progress is waited for and thrown away, and an open editor is ended the
    // way ExtensionSession's destructor does it (its channel closed, then SIGTERM, then SIGKILL).
    // Called again, does nothing.
    void stop();

    // True while an editor is open.
    bool isEditorOpen() const { return m_offer != nullptr; }
    // How many files wait for the editor.
    qsizetype waitingCount() const { return m_queue.size(); }

private:
    struct Offer;
    struct Examination;

    void fileFinished(const QString &path);
    void offerNext();
    void examined(Examination examination);
    void openEditor(const QString &source, const FileIdentity &identity, std::unique_ptr<PrivateClone> clone);
    void endOffer(Offer *offer);
    void notifyFailure(const QString &source);
    bool isBusy() const { return m_examining || m_offer; }

    WatchSettings m_settings;
    FolderWatcher *m_watcher = nullptr;
    DesktopNotifier *m_notifier = nullptr;
    OfferQueue m_queue;
    OfferedFiles m_offered;
    QThreadPool m_worker;
    bool m_examining = false;
    bool m_stopping = false;
    std::unique_ptr<Offer> m_offer;
};

// Runs the watch mode until SIGTERM or SIGINT; the exit status of `zaf-host --watch`: 0 after a
// clean end, 1 when the folder cannot be watched.
int runWatchMode(const WatchSettings &settings);

} // namespace zaf::host::watch
