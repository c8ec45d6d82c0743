#pragma once

// The activities this desktop performs itself: mail (xdg-email), open with (xdg-open), save to a
// folder, save to the video library, and copy to the clipboard.
//
// Helper programs are run asynchronously; the activity finishes completed when the program exits
// with status 0, and otherwise finishes not completed with a kShareErrorProgramFailed error. The
// program is taken from an environment variable when it is set (ZAF_XDG_EMAIL, ZAF_XDG_OPEN), so
// that a deployment or a test can put another one in its place.
//
// Threads: main thread only (the video library's completion is brought back to the main thread).

#include "platform/ui/share_activity.h"

#include <QList>
#include <QString>

#include <functional>

class QProcess;

namespace zaf::ui {

// Sends the items by mail: every file as an attachment, the texts as the body, separated by blank
// lines. Mail programs read attachments after xdg-email has returned, so files that live in a
// temporary or cache directory (which the application may empty at any moment) are first copied
// into the per-user share folder and the copy is attached.
class MailShareActivity : public ShareActivity {
    Q_OBJECT
public:
    explicit MailShareActivity(QObject *parent = nullptr);
    QString activityType() const override;
    QString activityTitle() const override;
    QIcon activityImage() const override;
    bool canPerformWithActivityItems(const QVariantList &activityItems) override;
    void performActivity() override;

    // $XDG_DATA_HOME/Zafrel/Shared/ (default ~/.local/share/Zafrel/Shared/), ending in "/".
    static QString sharedFolderPath();
    // Whether a file lies in a directory whose contents may vanish (the temporary and cache dirs).
    static bool isInVolatileDirectory(const QString &path);
};

// Opens the movie (the first file among the items) in the desktop's default application.
class OpenWithShareActivity : public ShareActivity {
    Q_OBJECT
public:
    explicit OpenWithShareActivity(QObject *parent = nullptr);
    QString activityType() const override;
    QString activityTitle() const override;
    QIcon activityImage() const override;
    bool canPerformWithActivityItems(const QVariantList &activityItems) override;
    void performActivity() override;
};

// Copies the files into a folder the user picks. An existing file is never overwritten: the copy
// takes the next free name ("Movie 2.mov", "Movie 3.mov", ...).
class SaveToFolderShareActivity : public ShareActivity {
    Q_OBJECT
public:
    // Asks for a folder, then calls `done` with its path, or with an empty string when the user
    // cancelled. The default shows a directory dialog over the presentation widget.
    using FolderChooser = std::function<void(QWidget *parent, std::function<void(const QString &folder)> done)>;

    explicit SaveToFolderShareActivity(QObject *parent = nullptr);
    QString activityType() const override;
    QString activityTitle() const override;
    QIcon activityImage() const override;
    bool canPerformWithActivityItems(const QVariantList &activityItems) override;
    void performActivity() override;

    // Replaces the folder dialog for every instance (tests); an empty function restores the dialog.
    static void setFolderChooserForTesting(FolderChooser chooser);
    // The paths written by the last run, in item order.
    QStringList savedPaths() const { return m_savedPaths; }

    // The first path in `folder` for `fileName` that does not exist yet.
    static QString uniqueDestination(const QString &folder, const QString &fileName, int attempt = 1);

private:
    void saveInto(const QString &folder);
    QStringList m_savedPaths;
};

// Saves the movies into the user's video library (PhotoLibrary::sharedPhotoLibrary()).
class SaveToVideoLibraryShareActivity : public ShareActivity {
    Q_OBJECT
public:
    explicit SaveToVideoLibraryShareActivity(QObject *parent = nullptr);
    QString activityType() const override;
    QString activityTitle() const override;
    QIcon activityImage() const override;
    bool canPerformWithActivityItems(const QVariantList &activityItems) override;
    void performActivity() override;
};

// Puts the items on the clipboard: the file URIs as text/uri-list, and as text the texts followed
// by the file URIs, one per line.
class CopyShareActivity : public ShareActivity {
    Q_OBJECT
public:
    explicit CopyShareActivity(QObject *parent = nullptr);
    QString activityType() const override;
    QString activityTitle() const override;
    QIcon activityImage() const override;
    bool canPerformWithActivityItems(const QVariantList &activityItems) override;
    void performActivity() override;
};

// The platform activities in their default order, made as children of `parent`.
QList<ShareActivity *> makePlatformShareActivities(QObject *parent);

} // namespace zaf::ui
