// Preview and edit modes: the toolbar arrangements of the two modes, and the fading of the controls.
#include "editor/editor.h"

#include "platform/ui/backdrop_view.h"
#include "platform/ui/bar_button_item.h"
#include "platform/ui/toolbar.h"
#include "platform/ui/view_animation.h"

using namespace zaf::ui;

namespace {
constexpr double kFadeDuration = 0.25;
}

void ZafVideoEditorViewController::setToolbarItems(Toolbar *toolbar, const QList<BarButtonItem *> &items)
{
    toolbar->setItems(items, false);
}

void ZafVideoEditorViewController::editMode()
{
    if (m_padMode) {
        setToolbarItems(m_topToolBar, {m_cancelTrimButton, m_flexSpace, m_titleButton, m_flexSpace, m_playButton,
                                       m_fixSpace, m_trimButton});
    } else {
        setToolbarItems(m_bottomToolBar, {m_flexSpace, m_playButton, m_flexSpace});
        setToolbarItems(m_topToolBar, {m_cancelTrimButton, m_flexSpace, m_titleButton, m_flexSpace, m_trimButton});
    }
    m_hasEdit = true;
}

void ZafVideoEditorViewController::previewMode()
{
    BarButtonItem *finish = m_hasEdit ? m_doneButton : m_cancelButton;
    if (m_padMode) {
        setToolbarItems(m_topToolBar, {finish, m_flexSpace, m_titleButton, m_flexSpace, m_playButton, m_fixSpace,
                                       m_shareButton, m_fixSpace, m_saveButton});
    } else {
        setToolbarItems(m_bottomToolBar, {m_shareButton, m_flexSpace, m_playButton, m_flexSpace});
        setToolbarItems(m_topToolBar, {finish, m_flexSpace, m_titleButton, m_flexSpace, m_saveButton});
    }
}

void ZafVideoEditorViewController::showUI()
{
    animate(kFadeDuration, [this] {
        setAlpha(m_topToolBar, 1);
        setAlpha(m_bottomToolBar, 1);
        setAlpha(m_scrubberContainterView, 1);
    });
    m_uiHidden = false;
}

void ZafVideoEditorViewController::hideUI()
{
    animate(kFadeDuration, [this] {
        setAlpha(m_topToolBar, 0);
        setAlpha(m_bottomToolBar, 0);
        setAlpha(m_scrubberContainterView, 0);
    });
    m_uiHidden = true;
}

void ZafVideoEditorViewController::configureReplayUIHidden()
{
    if (m_uiHidden)
        showUI();
    else
        hideUI();
}

void ZafVideoEditorViewController::handleSingleTap(QObject *)
{
    configureReplayUIHidden();
}
