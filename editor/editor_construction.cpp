// The editor's data model, its two initializers, the home-button check, the appearance callbacks
// and the clean-up when the editor goes away.
#include "editor/editor.h"

#include "editor/editor_constants.h"
#include "editor/date_extensions.h"
#include "overlay/video_overlay_button.h"
#include "platform/capability/capability_service.h"
#include "platform/dispatch.h"
#include "platform/media/export_session.h"
#include "platform/media/media_asset.h"
#include "platform/media/player_item.h"
#include "platform/media/player_layer.h"
#include "platform/ui/backdrop_view.h"
#include "platform/ui/bar_button_item.h"
#include "platform/ui/layout_rules.h"
#include "platform/ui/autoresizing.h"
#include "platform/ui/tap_gesture_recognizer.h"
#include "platform/ui/toolbar.h"
#include "platform/ui/view_animation.h"
#include "tempstore/temp_store.h"

#include <QFontMetrics>
#include <QLabel>
#include <QWidget>

#include <mutex>

Q_LOGGING_CATEGORY(lcEditor, "zaf.editor")

using namespace zaf::media;
using namespace zaf::ui;

const char *const ZafActivityTypeSaveToPhotoLibrary = "com.zafrel.activity.SaveToPhotoLibrary";

namespace {

constexpr double kTitleLabelWidth = 120;
constexpr double kTitleLineHeight = 17;
constexpr int kTitleFontSize = 15;
constexpr int kDateFontSize = 10;
constexpr double kFixedSpaceWidthFraction = 0.005;
constexpr double kZoomDelay = 0.5;
constexpr double kScrubberEdgeInset = 10.0;
constexpr int kTimelineBackdropStyle = 2010;
constexpr std::int64_t kOverlayPlayButtonStyle = 0;
constexpr std::int32_t kNoHomeButtonAnswer = 2;
constexpr std::int32_t kPlayheadTimescale = 1000000000;

QRect frameRect(double x, double y, double w, double h)
{
    return QRectF(x, y, w, h).toRect();
}

} // namespace

bool ZafVideoEditorViewController::deviceHasHomeButton()
{
    static bool hasHomeButton = true;
    static std::once_flag once;
    std::call_once(once, [] {
        const std::int32_t answer =
            zaf::CapabilityService::shared().integerAnswer(QLatin1String(zaf::capability::kHomeButtonType), 0);
        hasHomeButton = answer != kNoHomeButtonAnswer;
    });
    return hasHomeButton;
}

ZafVideoEditorViewController::ZafVideoEditorViewController(const QString &bundleIdentifier, const QUrl &url,
                                                           const QString &applicationName, QObject *parent)
    : ZafVideoEditorViewController(bundleIdentifier, url, applicationName, QColor(), QRectF(), parent)
{
}

ZafVideoEditorViewController::ZafVideoEditorViewController(const QString &bundleIdentifier, const QUrl &url,
                                                           const QString &applicationName,
                                                           const QColor &overrideTintColor, const QRectF &size,
                                                           QObject *parent)
    : ViewController(parent), m_mainGate(zaf::dispatch::MainGate::create())
{
    QWidget *root = view();
    if (!size.isEmpty())
        root->setGeometry(size.toRect());

    m_activityTypes.clear();
    m_hasEdit = false;
    m_hasHomeButton = deviceHasHomeButton();
    m_shareSheetUp = false;

    // The transparent layer over the video that takes the single tap. It covers the whole view
    // (and follows it when the window is resized, so a tap anywhere on the video toggles the bars).
    m_videoOverlay = new QWidget(root);
    m_videoOverlay->setObjectName(QStringLiteral("videoOverlay"));
    m_videoOverlay->setGeometry(QRect(QPoint(0, 0), root->size()));
    m_uiHidden = false;
    auto *tap = new TapGestureRecognizer(this, "handleSingleTap", this);
    tap->attachToView(m_videoOverlay);

    // The large play button keeps its size and sits in the middle of the editor's view. On a desktop
    // the window is the screen the editor has: centred on the monitor, the button would land off
    // the video, or outside a small window. Flexible margins keep it in the middle as the window is
    // resized, whichever variant the factory chose.
    m_videoOverlayPlayButton = ZafVideoOverlayButtonFactory::_srVideoOverlayButtonWithStyle(kOverlayPlayButtonStyle);
    QWidget *overlayButton = m_videoOverlayPlayButton->widget();
    overlayButton->setParent(root);
    overlayButton->move(QPointF(root->width() * 0.5 - overlayButton->width() * 0.5,
                                root->height() * 0.5 - overlayButton->height() * 0.5)
                            .toPoint());
    zaf::ui::setAutoresizingMask(overlayButton, zaf::ui::kFlexibleMargins);
    m_videoOverlayPlayButton->setTargetAction(this, "playAction");
    overlayButton->setToolTip(tr("Play (Space)"));

    m_introMode = true;
    m_originalVideoURL = url;
    m_videoURL = url;
    m_applicationName = applicationName;
    m_bundleIdentifier = bundleIdentifier;

    m_titleLabel = makeTitleLabel();
    m_titleButton = new BarButtonItem(m_titleLabel, this);
    m_trimFilePath = trimFileURL();
    m_trimming = false;
    m_exporting = false;

    m_mvAsset = MediaAsset::assetWithURL(url);
    m_mvPlayerItem = std::make_shared<PlayerItem>(m_mvAsset);
    m_mvPlayer = std::make_unique<Player>(m_mvPlayerItem);
    m_mvPlayer->seekToTime(MediaTime::zero());
    registerForEndOfPlayback();

    m_mvPlayerLayer = new PlayerLayer(root);
    m_mvPlayerLayer->setObjectName(QStringLiteral("mvPlayerLayer"));
    m_mvPlayerLayer->setPlayer(m_mvPlayer.get());
    observeStatusOfCurrentItem();

    m_scrubberContainterView = new BackdropView(kTimelineBackdropStyle, root);
    m_scrubberContainterView->setObjectName(QStringLiteral("scrubberContainterView"));
    m_scrubberContainterView->setGeometry(QRect());

    m_mvTrimmer = new MovieScrubber(m_scrubberContainterView);
    m_mvTrimmer->setObjectName(QStringLiteral("mvTrimmer"));
    m_mvTrimmer->setMinimumTrimLength(zaf::editor::kMinimumTrimLength);
    m_mvTrimmer->setEditable(true);
    m_mvTrimmer->setZoomDelay(kZoomDelay);
    m_mvTrimmer->setEdgeInset(kScrubberEdgeInset);
    // The timeline fills its container's width whatever the container's size (flexible width).
    LayoutRules *containerRules = LayoutRules::forView(m_scrubberContainterView);
    for (LayoutAttribute edge : {LayoutAttribute::Leading, LayoutAttribute::Trailing, LayoutAttribute::Top,
                                 LayoutAttribute::Bottom})
        containerRules->addRule({m_mvTrimmer, edge, m_scrubberContainterView, edge, 1, 0, QByteArray()});

    m_scrubbing = false;
    addPlaybackTimeObserver();

    createBarButtonItems();
    m_fixSpace->setWidth(kFixedSpaceWidthFraction * root->geometry().width());
    createToolbars(overrideTintColor);

    // A black backdrop behind the video, with the view's frame (it does not follow later resizes;
    // the video surface paints black around the picture itself).
    auto *black = new QWidget(root);
    black->setObjectName(QStringLiteral("blackBackground"));
    black->setGeometry(root->geometry());
    black->setAutoFillBackground(true);
    QPalette palette = black->palette();
    palette.setColor(QPalette::Window, Qt::black);
    black->setPalette(palette);
    addSubview(root, black);
    addSubview(root, m_mvPlayerLayer);
    addSubview(root, m_videoOverlay);
    addSubview(root, m_bottomToolBar);
    addSubview(root, m_topToolBar);
    addSubview(root, m_scrubberContainterView);
    addSubview(m_scrubberContainterView, m_mvTrimmer);
    addSubview(root, overlayButton);

    applyLayoutChoice();
    installKeyboardShortcuts();
}

QLabel *ZafVideoEditorViewController::makeTitleLabel()
{
    // Qt clips children to their parent, so the title is two lines high: the application name in
    // the top line and the recording date in a child label right below it.
    auto *title = new QLabel;
    title->setObjectName(QStringLiteral("titleLabel"));
    title->setFixedSize(int(kTitleLabelWidth), int(2 * kTitleLineHeight));
    title->setContentsMargins(0, 0, 0, int(kTitleLineHeight));
    QFont font = title->font();
    font.setPixelSize(kTitleFontSize);
    title->setFont(font);
    title->setAutoFillBackground(false);
    title->setAttribute(Qt::WA_TranslucentBackground);
    title->setStyleSheet(QStringLiteral("color: black; background: transparent;"));
    // A name wider than the title is shortened with an ellipsis (the whole name is in the tooltip).
    title->setText(QFontMetrics(font).elidedText(m_applicationName, Qt::ElideRight, int(kTitleLabelWidth)));
    title->setToolTip(m_applicationName);
    title->setAlignment(Qt::AlignHCenter | Qt::AlignVCenter);

    auto *date = new QLabel(title);
    date->setObjectName(QStringLiteral("dateLabel"));
    date->setGeometry(frameRect(0, kTitleLineHeight, kTitleLabelWidth, kTitleLineHeight));
    QFont dateFont = date->font();
    dateFont.setPixelSize(kDateFontSize);
    date->setFont(dateFont);
    date->setStyleSheet(QStringLiteral("color: black; background: transparent;"));
    date->setAlignment(Qt::AlignHCenter | Qt::AlignVCenter);
    date->setText(ZafDateExtensions::_srGetStringFromDate(ZafDateExtensions::_srGetCreationDateForFile(m_videoURL)));
    return title;
}

void ZafVideoEditorViewController::createBarButtonItems()
{
    m_shareButton = new BarButtonItem(SystemItem::Action, this, &ZafVideoEditorViewController::shareAction, this);
    m_undoButton = new BarButtonItem(SystemItem::Undo, this, &ZafVideoEditorViewController::undoAction, this);
    m_pauseButton = new BarButtonItem(SystemItem::Pause, this, &ZafVideoEditorViewController::pauseAction, this);
    m_playButton = new BarButtonItem(SystemItem::Play, this, &ZafVideoEditorViewController::playAction, this);
    m_doneButton = new BarButtonItem(SystemItem::Done, this, &ZafVideoEditorViewController::doneAction, this);
    m_saveButton = new BarButtonItem(SystemItem::Save, this, &ZafVideoEditorViewController::saveAction, this);
    m_cancelButton = new BarButtonItem(SystemItem::Cancel, this, &ZafVideoEditorViewController::doneAction, this);
    m_cancelTrimButton = new BarButtonItem(SystemItem::Cancel, this, &ZafVideoEditorViewController::undoAction, this);
    m_trimButton = new BarButtonItem(SystemItem::Done, this, &ZafVideoEditorViewController::saveAction, this);
    m_flexSpace = new BarButtonItem(SystemItem::FlexibleSpace, this);
    m_fixSpace = new BarButtonItem(SystemItem::FixedSpace, this);

    // Tooltips say what each item does and its key.
    m_shareButton->setToolTip(tr("Share"));
    m_undoButton->setToolTip(tr("Undo (Ctrl+Z)"));
    m_pauseButton->setToolTip(tr("Pause (Space)"));
    m_playButton->setToolTip(tr("Play (Space)"));
    m_doneButton->setToolTip(tr("Done (Esc)"));
    m_saveButton->setToolTip(tr("Save to Videos (Ctrl+S)"));
    m_cancelButton->setToolTip(tr("Cancel (Esc)"));
    m_cancelTrimButton->setToolTip(tr("Cancel Trim (Esc)"));
    m_trimButton->setToolTip(tr("Trim (Return)"));
}

void ZafVideoEditorViewController::createToolbars(const QColor &tint)
{
    QWidget *root = view();
    const QRect bounds(QPoint(0, 0), root->size());
    const double topHeight = zaf::editor::topToolbarHeight(m_hasHomeButton);
    m_topToolBar = new Toolbar(root);
    m_topToolBar->setObjectName(QStringLiteral("topToolBar"));
    m_topToolBar->setGeometry(frameRect(0, 0, bounds.width(), topHeight));
    m_topToolBar->setDelegate(this);
    if (tint.isValid())
        m_topToolBar->setTintColor(tint);

    const double bottomHeight = zaf::editor::bottomToolbarHeight(m_hasHomeButton);
    m_bottomToolBar = new Toolbar(root);
    m_bottomToolBar->setObjectName(QStringLiteral("bottomToolBar"));
    m_bottomToolBar->setGeometry(frameRect(0, bounds.height() - bottomHeight, bounds.width(), bottomHeight));
    m_bottomToolBar->setDelegate(this);
}

void ZafVideoEditorViewController::addPlaybackTimeObserver()
{
    QPointer<ZafVideoEditorViewController> weakSelf(this);
    m_playbackTimeObserver = m_mvPlayer->addPeriodicTimeObserver(
        MediaTime::fromSeconds(1.0 / 30.0, kPlayheadTimescale), [weakSelf](const MediaTime &) {
            ZafVideoEditorViewController *self = weakSelf.data();
            if (!self || self->m_scrubbing)
                return;
            const std::shared_ptr<PlayerItem> item = self->m_mvPlayer ? self->m_mvPlayer->currentItem() : nullptr;
            const double seconds = item ? item->currentTime().seconds() : MediaTime::zero().seconds();
            self->m_mvTrimmer->setValue(seconds);
        });
}

void ZafVideoEditorViewController::viewWillAppear(bool animated)
{
    becomeFirstResponder();
    ViewController::viewWillAppear(animated);
}

void ZafVideoEditorViewController::viewDidAppear(bool animated)
{
    ViewController::viewDidAppear(animated);
}

void ZafVideoEditorViewController::viewWillDisappear(bool animated)
{
    resignFirstResponder();
    ViewController::viewWillDisappear(animated);
}

ZafVideoEditorViewController::~ZafVideoEditorViewController()
{
    if (m_mvPlayer)
        m_mvPlayer->removeTimeObserver(m_playbackTimeObserver);
    stopObservingStatusOfCurrentItem();
    removeAllNotificationRegistrations();
    // The timeline and the video surface outlive this body (the view owns them): cut their ties.
    if (m_mvTrimmer) {
        m_mvTrimmer->setDelegate(nullptr);
        m_mvTrimmer->setDataSource(nullptr);
    }
    if (m_mvPlayerLayer)
        m_mvPlayerLayer->setPlayer(nullptr);
    // A trim completion waiting to reload returns without it: the main thread is busy here.
    m_mainGate->close();
    // Exports write into the temporary directory: it is emptied only once they have stopped.
    for (const std::shared_ptr<ExportSession> &session : {m_exportSession, m_mixSession}) {
        if (session)
            session->cancelExportAndWait();
    }
    // The temporary directory's contents belong to the running editor.
    ZafTempStore::defaultStore()._srDeleteAllTempFiles();
}
