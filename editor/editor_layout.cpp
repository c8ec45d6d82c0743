// Layout and rotation: the small-screen and large-screen layouts, the choice between them, and the
// refit of the video, the toolbars and the timeline when the view changes size.
#include "editor/editor.h"

#include "editor/editor_constants.h"
#include "platform/media/player_layer.h"
#include "platform/ui/backdrop_view.h"
#include "platform/ui/bar_button_item.h"
#include "platform/ui/layout_rules.h"
#include "platform/ui/screen.h"
#include "platform/ui/toolbar.h"
#include "platform/ui/transition_coordinator.h"
#include "platform/ui/view_animation.h"

#include <QLabel>
#include <QWidget>

using namespace zaf::ui;

namespace {

const EdgeInsets kNoInsets{0, 0, 0, 0};
const EdgeInsets kPadPlayInsets{8, 0, -8, 0};
const EdgeInsets kPadShareInsets{5, 0, -5, 0};

// The timeline container's rules of the layout in force; a layout retires the other's rules so
// that no stale rule survives a switch.
const QByteArray kTimelineRules = QByteArrayLiteral("timeline");

} // namespace

void ZafVideoEditorViewController::applyLayoutChoice()
{
    if (Device::canTellUserInterfaceIdiom() && Device::userInterfaceIdiom() == zaf::DeviceIdiom::Pad)
        applyPadUILayout();
    else if (currentOrientation() == 1)
        applyPadUILayout();
    else
        applyPhoneUILayout();
}

int ZafVideoEditorViewController::currentOrientation()
{
    const QRectF bounds = viewBounds();
    return bounds.width() > bounds.height() ? 1 : 0;
}

void ZafVideoEditorViewController::applyPhoneUILayout()
{
    m_playButton->setImageInsets(kNoInsets);
    m_pauseButton->setImageInsets(kNoInsets);
    m_shareButton->setImageInsets(kNoInsets);
    if (m_trimming) {
        setToolbarItems(m_topToolBar, {m_cancelTrimButton, m_flexSpace, m_titleButton, m_flexSpace, m_trimButton});
        setToolbarItems(m_bottomToolBar, {m_flexSpace, m_playButton, m_flexSpace});
    } else {
        if (m_introMode)
            setToolbarItems(m_bottomToolBar, {m_shareButton, m_flexSpace});
        else
            setToolbarItems(m_bottomToolBar, {m_shareButton, m_flexSpace, m_playButton, m_flexSpace});
        setToolbarItems(m_topToolBar, {m_cancelButton, m_flexSpace, m_titleButton, m_flexSpace, m_saveButton});
    }
    addSubview(view(), m_bottomToolBar);
    applyPhoneConstraints();
    m_padMode = false;
}

void ZafVideoEditorViewController::applyPadUILayout()
{
    m_playButton->setImageInsets(kPadPlayInsets);
    m_pauseButton->setImageInsets(kPadPlayInsets);
    m_shareButton->setImageInsets(kPadShareInsets);
    if (m_trimming) {
        setToolbarItems(m_topToolBar, {m_cancelTrimButton, m_flexSpace, m_titleButton, m_flexSpace, m_playButton,
                                       m_fixSpace, m_trimButton});
    } else if (m_introMode) {
        setToolbarItems(m_topToolBar, {m_cancelButton, m_flexSpace, m_titleButton, m_flexSpace, m_shareButton,
                                       m_fixSpace, m_saveButton});
    } else {
        setToolbarItems(m_topToolBar, {m_cancelButton, m_flexSpace, m_titleButton, m_flexSpace, m_playButton,
                                       m_fixSpace, m_shareButton, m_fixSpace, m_saveButton});
    }
    removeFromSuperview(m_bottomToolBar);
    applyPadConstraints();
    m_padMode = true;
}

void ZafVideoEditorViewController::applyPhoneConstraints()
{
    LayoutRules *rules = LayoutRules::forView(view());
    rules->removeRulesInGroup(kTimelineRules);
    rules->addRules({
        {m_scrubberContainterView, LayoutAttribute::Leading, view(), LayoutAttribute::Leading, 1, 0, kTimelineRules},
        {m_scrubberContainterView, LayoutAttribute::Trailing, view(), LayoutAttribute::Trailing, 1, 0, kTimelineRules},
        {m_scrubberContainterView, LayoutAttribute::Bottom, m_bottomToolBar, LayoutAttribute::Top, 1, 0, kTimelineRules},
        {m_scrubberContainterView, LayoutAttribute::Height, nullptr, LayoutAttribute::Leading, 1, zaf::editor::kTimelineHeight,
         kTimelineRules},
    });
    rules->layoutIfNeeded();
}

void ZafVideoEditorViewController::applyPadConstraints()
{
    LayoutRules *rules = LayoutRules::forView(view());
    rules->removeRulesInGroup(kTimelineRules);
    rules->addRules({
        {m_scrubberContainterView, LayoutAttribute::Leading, view(), LayoutAttribute::Leading, 1, 0, kTimelineRules},
        {m_scrubberContainterView, LayoutAttribute::Trailing, view(), LayoutAttribute::Trailing, 1, 0, kTimelineRules},
        {m_scrubberContainterView, LayoutAttribute::Bottom, view(), LayoutAttribute::Bottom, 1, 0, kTimelineRules},
        {m_scrubberContainterView, LayoutAttribute::Height, nullptr, LayoutAttribute::Leading, 1, zaf::editor::kTimelineHeight,
         kTimelineRules},
    });
    rules->layoutIfNeeded();
}

void ZafVideoEditorViewController::viewDidLayoutSubviews()
{
    ViewController::viewDidLayoutSubviews();
    const QRect bounds(QPoint(0, 0), view()->size());
    m_mvPlayerLayer->setGeometry(bounds);
    m_videoOverlay->setGeometry(bounds);
    if (m_unplayableMessageLabel)
        m_unplayableMessageLabel->setGeometry(unplayableMessageFrame());
}

void ZafVideoEditorViewController::refreshMvRotation()
{
    const QRect bounds(QPoint(0, 0), view()->size());
    m_mvPlayerLayer->setGeometry(bounds);
    const double top = zaf::editor::topToolbarHeight(m_hasHomeButton);
    m_topToolBar->setGeometry(QRectF(0, 0, bounds.width(), top).toRect());
    const double bottom = zaf::editor::bottomToolbarHeight(m_hasHomeButton);
    m_bottomToolBar->setGeometry(QRectF(0, bounds.height() - bottom, bounds.width(), bottom).toRect());
    m_thumbnailGenerator.reset();
    m_cachedTimeStamps.reset();
    m_mvTrimmer->reloadData();
}

void ZafVideoEditorViewController::viewWillTransitionToSize(const QSizeF &size, TransitionCoordinator &coordinator)
{
    ViewController::viewWillTransitionToSize(size, coordinator);
    coordinator.animateAlongsideTransition(
        [this, size] {
            // The block works with the view's new bounds.
            if (view()->size() != size.toSize())
                view()->resize(size.toSize());
            setToolbarItems(m_topToolBar, {});
            setToolbarItems(m_bottomToolBar, {});
            refreshMvRotation();
            applyLayoutChoice();
        },
        [] {});
}
