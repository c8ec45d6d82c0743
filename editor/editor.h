#pragma once

// ZafVideoEditorViewController: the editor. It plays the recorded movie under two toolbars with
// the timeline, lets the user trim, save and share, and reports the actions carried out to its
// delegate when the user is done.
//
// Threads. Everything runs on the main thread: construction, the actions, the timeline's delegate
// and data-source calls, the player's observers, layout and destruction. Work that finishes
// elsewhere comes back to the main thread before it touches the editor: the trim export's
// completion (synchronously, so the export's thread waits for the reload), the thumbnail
// generator's answers (stored into the cache on the main thread), and the end of a save.
// The trim export's synchronous hop goes through the editor's main gate, which the destructor
// closes first: a completion waiting in its hop then returns without the reload, so the destructor
// can cancel the trim export and the save's mix and wait until they have stopped writing before it
// empties the temporary directory. A completion acts only for the export whose session id is the
// current one; an older export's completion is ignored.
//
// Order of events for one movie: construction loads the movie (status unknown); the item's status
// change to ready makes the editor the timeline's delegate and data source and reloads it; the
// timeline then asks for duration, aspect ratio, timestamps and thumbnails. Play, pause, the
// timeline callbacks and the end of playback follow as the user acts. A trim export's success
// reloads a new player and the sequence starts again at "status unknown" for the new movie.
//
// The class is split by concern over several files: editor_construction.cpp (data model,
// initializers, appearance, destruction), editor_playback.cpp, editor_modes.cpp,
// editor_trimming.cpp, editor_thumbnails.cpp, editor_layout.cpp, editor_save.cpp,
// editor_share.cpp, editor_keyboard.cpp (desktop shortcuts) and editor_unplayable_movie.cpp (a
// movie that cannot be played).

#include "platform/media/media_time.h"
#include "platform/media/player.h"
#include "platform/ui/movie_scrubber.h"
#include "platform/ui/view_controller.h"

#include <QColor>
#include <QHash>
#include <QImage>
#include <QLoggingCategory>
#include <QPointer>
#include <QRectF>
#include <QStringList>
#include <QUrl>
#include <QtPlugin>

#include <atomic>
#include <memory>
#include <optional>

class QLabel;
class QWidget;
class ZafStoreInfo;
class ZafVideoOverlayButton;

namespace zaf::media {
class ExportSession;
class ImageGenerator;
class MediaAsset;
class PlayerItem;
class PlayerLayer;
} // namespace zaf::media

namespace zaf::dispatch {
class MainGate;
} // namespace zaf::dispatch

namespace zaf::ui {
class BackdropView;
class BarButtonItem;
class Toolbar;
} // namespace zaf::ui

Q_DECLARE_LOGGING_CATEGORY(lcEditor)

class ZafVideoEditorViewController;

// The editor's delegate: told once the user is done, with the activity types carried out.
// Implemented by a QObject (the editor keeps it weakly). Called on the main thread.
class ZafVideoEditorViewControllerDelegate {
public:
    virtual ~ZafVideoEditorViewControllerDelegate() = default;
    virtual void videoEditorDidFinishWithActivityTypes(ZafVideoEditorViewController *editor,
                                                       const QStringList &activityTypes) = 0;
};
#define ZafVideoEditorViewControllerDelegate_iid "com.zafrel.VideoEditor.ZafVideoEditorViewControllerDelegate"
Q_DECLARE_INTERFACE(ZafVideoEditorViewControllerDelegate, ZafVideoEditorViewControllerDelegate_iid)

// The activity type of a save to the video library, as the share sheet names it.
extern const char *const ZafActivityTypeSaveToPhotoLibrary;

class ZafVideoEditorViewController : public zaf::ui::ViewController,
                                     public zaf::ui::MovieScrubberDelegate,
                                     public zaf::ui::MovieScrubberDataSource {
    Q_OBJECT
public:
    using MediaTime = zaf::media::MediaTime;

    // The full initializer: the movie at url of the recording application (identifier, name); a tint
    // colour for the top toolbar (invalid: none); the frame of the editor's view (empty: leave it).
    ZafVideoEditorViewController(const QString &bundleIdentifier, const QUrl &url, const QString &applicationName,
                                 const QColor &overrideTintColor, const QRectF &size, QObject *parent = nullptr);
    ZafVideoEditorViewController(const QString &bundleIdentifier, const QUrl &url, const QString &applicationName,
                                 QObject *parent = nullptr);
    ~ZafVideoEditorViewController() override;

    // Whether the device has a home button (asked once per process).
    static bool deviceHasHomeButton();

    // --- Appearance (construction file) ---
    void viewWillAppear(bool animated) override;
    void viewDidAppear(bool animated) override;
    void viewWillDisappear(bool animated) override;
    bool canBecomeFirstResponder() const override { return true; }

    // --- Playback ---
    // The "status" observation of the current player item.
    void observeValueForKeyPathOfObjectChangeContext(const QString &keyPath, QObject *object,
                                                     const QVariantMap &change, void *context);
    void itemDidFinishPlaying(QObject *notificationObject);
    // Reached by name too: the overlay play button's target-action.
    Q_INVOKABLE void playAction();
    void pauseAction();
    void reloadMvLayerWithURL(const QUrl &url);
    // The current item failed to load, or holds no picture (unplayable movie file).
    bool currentItemIsUnplayable() const;
    // Says in the video area that the movie cannot be played, and why; leaves only Cancel.
    void showUnplayableMovieMessage();
    // The message, once shown (null before).
    QLabel *unplayableMovieMessage() const;
    double getPlayerDuration() const;
    QSizeF getVideoSize() const;

    // --- Preview and edit modes ---
    // Reached by name: the tap gesture recognizer's target-action.
    Q_INVOKABLE void handleSingleTap(QObject *recognizer);
    void configureReplayUIHidden();
    void showUI();
    void hideUI();
    void editMode();
    void previewMode();
    void motionEnded(zaf::ui::MotionSubtype subtype, const zaf::ui::MotionEvent &event) override;

    // --- Trimming ---
    QUrl trimFileURL() const;
    // trimFileURL, or when that names an existing file or the movie being trimmed, the same name
    // with the first free counter after it ("-2", "-3", ...).
    QUrl freeTrimFileURL() const;
    void trimVideo();
    void undoAction();
    void movieScrubberValueDidChange(zaf::ui::MovieScrubber *scrubber, double value) override;
    void movieScrubberDidBeginScrubbingWithHandle(zaf::ui::MovieScrubber *scrubber, zaf::ui::MovieScrubberHandle handle) override;
    void movieScrubberDidEndScrubbingWithHandle(zaf::ui::MovieScrubber *scrubber, zaf::ui::MovieScrubberHandle handle) override;
    void movieScrubberEditingStartValueDidChange(zaf::ui::MovieScrubber *scrubber, double value) override;
    void movieScrubberEditingEndValueDidChange(zaf::ui::MovieScrubber *scrubber, double value) override;
    void movieScrubberDidBeginEditing(zaf::ui::MovieScrubber *scrubber) override;
    void movieScrubberDidCancelEditing(zaf::ui::MovieScrubber *scrubber) override;

    // --- Thumbnails (the timeline's data source) ---
    double movieScrubberDuration(zaf::ui::MovieScrubber *scrubber) override;
    double movieScrubberThumbnailAspectRatio(zaf::ui::MovieScrubber *scrubber) override;
    QList<double> movieScrubberEvenlySpacedTimestampsStartingAtEndingAt(zaf::ui::MovieScrubber *scrubber, int count,
                                                                        double start, double end) override;
    void movieScrubberRequestThumbnailImageForTimestamp(zaf::ui::MovieScrubber *scrubber, double timestamp) override;
    void setThumbnailFromCacheWithTimeStamp(double timestamp);
    QSizeF getThumbnailSize() const;
    // The thumbnail size for a display size at a screen scale (what getThumbnailSize computes).
    static QSizeF thumbnailSizeForVideoSize(const QSizeF &videoSize, double scale);

    // --- Layout and rotation ---
    void applyPhoneUILayout();
    void applyPadUILayout();
    void applyPhoneConstraints();
    void applyPadConstraints();
    void viewDidLayoutSubviews() override;
    int currentOrientation();
    void viewWillTransitionToSize(const QSizeF &size, zaf::ui::TransitionCoordinator &coordinator) override;
    void refreshMvRotation();

    // --- Save and done ---
    void saveAction();
    void doneAction();

    // --- Share ---
    void shareAction();
    void displayShareSheetWithVideoURL(const QUrl &url);
    // The share sheet's completion (main thread): the sheet is down, and a completed activity's
    // type is recorded for the report.
    void shareSheetDidCompleteWithActivityType(const QString &activityType, bool completed);
    // The items shared for a store record: the override message, or the share text and the store
    // link; then the movie; then the host's attachment.
    QVariantList shareItemsForStoreInfo(const ZafStoreInfo &info, const QUrl &movieURL) const;
    // The share text: the localized format with the name and the author, or the name alone.
    static QString shareTextForStoreInfo(const ZafStoreInfo &info);
    // Whether the editor's own publishing action is offered: the video service's own share
    // extension is not installed and the publishing plug-in is there.
    static bool offersPublishingActivity();

    // --- Data model: plain getters, no side effects ---
    // The editor's state flags, edit range and files change only through its own operations, so
    // they have no public setters; the host-facing properties below keep theirs.
    QUrl videoURL() const { return m_videoURL; }
    zaf::media::Player *mvPlayer() const { return m_mvPlayer.get(); }
    zaf::media::PlayerLayer *mvPlayerLayer() const { return m_mvPlayerLayer; }
    std::shared_ptr<zaf::media::PlayerItem> mvPlayerItem() const { return m_mvPlayerItem; }
    std::shared_ptr<zaf::media::MediaAsset> mvAsset() const { return m_mvAsset; }
    zaf::ui::BackdropView *scrubberContainterView() const { return m_scrubberContainterView; }
    zaf::media::TimeObserverToken playbackTimeObserver() const { return m_playbackTimeObserver; }
    QString applicationName() const { return m_applicationName; }
    void setApplicationName(const QString &name) { m_applicationName = name; }
    QString bundleIdentifier() const { return m_bundleIdentifier; }
    void setBundleIdentifier(const QString &identifier) { m_bundleIdentifier = identifier; }
    zaf::media::TimeObserverToken timeObserver() const { return m_timeObserver; }
    bool isExporting() const { return m_exporting; }
    bool isScrubbing() const { return m_scrubbing; }
    bool isTrimming() const { return m_trimming; }
    bool isPadMode() const { return m_padMode; }
    bool isIntroMode() const { return m_introMode; }
    bool isUIHidden() const { return m_uiHidden; }
    bool isShareSheetUp() const { return m_shareSheetUp; }
    zaf::ui::Toolbar *bottomToolBar() const { return m_bottomToolBar; }
    zaf::ui::Toolbar *topToolBar() const { return m_topToolBar; }
    zaf::ui::BarButtonItem *shareButton() const { return m_shareButton; }
    zaf::ui::BarButtonItem *pauseButton() const { return m_pauseButton; }
    zaf::ui::BarButtonItem *saveButton() const { return m_saveButton; }
    zaf::ui::BarButtonItem *flexSpace() const { return m_flexSpace; }
    zaf::ui::BarButtonItem *doneButton() const { return m_doneButton; }
    zaf::ui::BarButtonItem *cancelButton() const { return m_cancelButton; }
    zaf::ui::BarButtonItem *cancelTrimButton() const { return m_cancelTrimButton; }
    zaf::ui::BarButtonItem *trimButton() const { return m_trimButton; }
    zaf::ui::BarButtonItem *undoButton() const { return m_undoButton; }
    zaf::ui::BarButtonItem *titleButton() const { return m_titleButton; }
    zaf::ui::BarButtonItem *playButton() const { return m_playButton; }
    zaf::ui::BarButtonItem *fixSpace() const { return m_fixSpace; }
    ZafVideoOverlayButton *videoOverlayPlayButton() const { return m_videoOverlayPlayButton; }
    QWidget *videoOverlay() const { return m_videoOverlay; }
    QLabel *titleLabel() const { return m_titleLabel; }
    double editStartTime() const { return m_editStartTime; }
    double editEndTime() const { return m_editEndTime; }
    QUrl trimFilePath() const { return m_trimFilePath; }
    QUrl originalVideoURL() const { return m_originalVideoURL; }
    std::shared_ptr<zaf::media::ExportSession> exportSession() const { return m_exportSession; }
    zaf::ui::MovieScrubber *mvTrimmer() const { return m_mvTrimmer; }
    std::shared_ptr<zaf::media::ImageGenerator> thumbnailGenerator() const { return m_thumbnailGenerator; }
    // The thumbnail cache (absent until the first request and after each discard).
    const std::optional<QHash<double, QImage>> &cachedTimeStamps() const { return m_cachedTimeStamps; }
    const QStringList &activityTypes() const { return m_activityTypes; }
    bool hasEdit() const { return m_hasEdit; }
    bool hasHomeButton() const { return m_hasHomeButton; }
    QObject *delegate() const { return m_delegate.data(); }
    // Must implement ZafVideoEditorViewControllerDelegate; kept weakly.
    void setDelegate(QObject *delegate) { m_delegate = delegate; }
    QUrl fileAttachmentURL() const { return m_fileAttachmentURL; }
    void setFileAttachmentURL(const QUrl &url) { m_fileAttachmentURL = url; }
    QString overrideShareMessage() const { return m_overrideShareMessage; }
    void setOverrideShareMessage(const QString &message) { m_overrideShareMessage = message; }

private:
    // Construction helpers (construction file).
    void createBarButtonItems();
    void createToolbars(const QColor &tint);
    QLabel *makeTitleLabel();
    void addPlaybackTimeObserver();
    // Observation of the current item: "status" and the end-of-playback notification.
    void observeStatusOfCurrentItem();
    void stopObservingStatusOfCurrentItem();
    void registerForEndOfPlayback();
    void removeAllNotificationRegistrations();
    // The seconds-to-time rule: the timescale of the player's current time (0 without a player).
    MediaTime mediaTimeFromSeconds(double seconds) const;
    // The layout choice: tablet idiom, else the view's orientation.
    void applyLayoutChoice();
    void setToolbarItems(zaf::ui::Toolbar *toolbar, const QList<zaf::ui::BarButtonItem *> &items);
    void finishWithDelegate();
    void presentShareSheet(const QVariantList &items, const QUrl &movieURL);
    void installKeyboardShortcuts();
    QRect unplayableMessageFrame();
    void setTrimPointAtPlayhead(bool start);
    // Whether sessionID names the trim export the editor holds now (an older export's completion
    // changes nothing).
    bool isCurrentTrimExport(std::uint64_t sessionID) const;

    QUrl m_videoURL;
    std::unique_ptr<zaf::media::Player> m_mvPlayer;
    zaf::media::PlayerLayer *m_mvPlayerLayer = nullptr;
    std::shared_ptr<zaf::media::PlayerItem> m_mvPlayerItem;
    std::shared_ptr<zaf::media::MediaAsset> m_mvAsset;
    zaf::ui::BackdropView *m_scrubberContainterView = nullptr;
    zaf::media::TimeObserverToken m_playbackTimeObserver = 0;
    QString m_applicationName;
    QString m_bundleIdentifier;
    zaf::media::TimeObserverToken m_timeObserver = 0;
    bool m_exporting = false;
    bool m_scrubbing = false;
    bool m_trimming = false;
    bool m_padMode = false;
    bool m_introMode = true;
    bool m_uiHidden = false;
    bool m_shareSheetUp = false;
    zaf::ui::Toolbar *m_bottomToolBar = nullptr;
    zaf::ui::Toolbar *m_topToolBar = nullptr;
    zaf::ui::BarButtonItem *m_shareButton = nullptr;
    zaf::ui::BarButtonItem *m_pauseButton = nullptr;
    zaf::ui::BarButtonItem *m_saveButton = nullptr;
    zaf::ui::BarButtonItem *m_flexSpace = nullptr;
    zaf::ui::BarButtonItem *m_doneButton = nullptr;
    zaf::ui::BarButtonItem *m_cancelButton = nullptr;
    zaf::ui::BarButtonItem *m_cancelTrimButton = nullptr;
    zaf::ui::BarButtonItem *m_trimButton = nullptr;
    zaf::ui::BarButtonItem *m_undoButton = nullptr;
    zaf::ui::BarButtonItem *m_titleButton = nullptr;
    zaf::ui::BarButtonItem *m_playButton = nullptr;
    zaf::ui::BarButtonItem *m_fixSpace = nullptr;
    // Owned by the editor's view once added to it (as every subview is).
    ZafVideoOverlayButton *m_videoOverlayPlayButton = nullptr;
    QWidget *m_videoOverlay = nullptr;
    QLabel *m_titleLabel = nullptr;
    QPointer<QLabel> m_unplayableMessageLabel;
    bool m_movieUnplayable = false;
    double m_editStartTime = 0;
    double m_editEndTime = 0;
    QUrl m_trimFilePath;
    QUrl m_originalVideoURL;
    std::shared_ptr<zaf::media::ExportSession> m_exportSession;
    // The export of the running save's mix (none before a save).
    std::shared_ptr<zaf::media::ExportSession> m_mixSession;
    // Closed by the destructor; the trim completion's hop to the main thread goes through it.
    std::shared_ptr<zaf::dispatch::MainGate> m_mainGate;
    zaf::ui::MovieScrubber *m_mvTrimmer = nullptr;
    std::shared_ptr<zaf::media::ImageGenerator> m_thumbnailGenerator;
    std::optional<QHash<double, QImage>> m_cachedTimeStamps;
    QStringList m_activityTypes;
    std::atomic<bool> m_hasEdit{false};
    std::atomic<bool> m_hasHomeButton{true};
    QPointer<QObject> m_delegate;
    QUrl m_fileAttachmentURL;
    QString m_overrideShareMessage;

    QList<QMetaObject::Connection> m_statusObservation;
    QList<QMetaObject::Connection> m_notificationRegistrations;
};
