// A movie the editor cannot play: its item failed to load (the file is missing, unreadable, empty
// or not a movie) or it holds no picture. The editor says so in the video area, where the black
// picture would be, with the file's name and a plain reason, and leaves only Cancel: there is
// nothing to play, trim, save or share. It shows no alert; Cancel and closing the window report
// nothing, as for any movie.
#include "editor/editor.h"

#include "overlay/video_overlay_button.h"
#include "platform/dispatch.h"
#include "platform/log.h"
#include "platform/media/media_asset.h"
#include "platform/media/player_item.h"
#include "platform/ui/bar_button_item.h"
#include "platform/ui/view_animation.h"

#include <QFileInfo>
#include <QLabel>

using namespace zaf::media;

namespace {

// Looks at the file, so it runs off the main thread.
QString reasonForUnplayableMovie(const QString &path)
{
    const QFileInfo info(path);
    if (!info.exists())
        return ZafVideoEditorViewController::tr("This file could not be found.");
    if (!info.isReadable())
        return ZafVideoEditorViewController::tr("This file could not be read.");
    return ZafVideoEditorViewController::tr("This file is not a movie this editor can play.");
}

} // namespace

bool ZafVideoEditorViewController::currentItemIsUnplayable() const
{
    const std::shared_ptr<PlayerItem> item = m_mvPlayer ? m_mvPlayer->currentItem() : nullptr;
    if (!item)
        return false;
    if (item->status() == PlayerItem::Status::Failed)
        return true;
    // Sound alone is no movie to trim: the timeline would stay empty under a black picture.
    return item->status() == PlayerItem::Status::ReadyToPlay && item->asset()
        && item->asset()->tracksWithMediaType(MediaType::Video).isEmpty();
}

void ZafVideoEditorViewController::showUnplayableMovieMessage()
{
    if (m_movieUnplayable)
        return;
    m_movieUnplayable = true;
    zaf::log::error(lcEditor(), QStringLiteral("ZafVideoEditorViewController: cannot play %1").arg(m_videoURL.toLocalFile()));
    for (zaf::ui::BarButtonItem *item : {m_saveButton, m_shareButton, m_playButton, m_pauseButton, m_trimButton})
        item->setEnabled(false);
    if (m_videoOverlayPlayButton)
        zaf::ui::removeFromSuperview(m_videoOverlayPlayButton->widget());

    const QString path = m_videoURL.toLocalFile();
    QPointer<ZafVideoEditorViewController> weakSelf(this);
    zaf::dispatch::async(zaf::dispatch::Priority::Default, [weakSelf, path] {
        const QString reason = reasonForUnplayableMovie(path);
        zaf::dispatch::main([weakSelf, path, reason] {
            ZafVideoEditorViewController *self = weakSelf.data();
            if (!self || self->m_videoURL.toLocalFile() != path)
                return;
            auto *label = new QLabel(self->view());
            label->setObjectName(QStringLiteral("unplayableMovieMessage"));
            label->setAlignment(Qt::AlignCenter);
            label->setWordWrap(true);
            label->setTextFormat(Qt::RichText);
            label->setText(QStringLiteral("<p style=\"font-size:large\"><b>%1</b></p><p>%2</p>")
                               .arg(QFileInfo(path).fileName().toHtmlEscaped(), reason.toHtmlEscaped()));
            label->setStyleSheet(QStringLiteral("color: white; background: transparent;"));
            label->setAttribute(Qt::WA_TransparentForMouseEvents);
            label->setGeometry(self->unplayableMessageFrame());
            // Over the black picture, under the tap layer and the toolbars.
            label->stackUnder(self->m_videoOverlay);
            label->show();
            self->m_unplayableMessageLabel = label;
        });
    });
}

QLabel *ZafVideoEditorViewController::unplayableMovieMessage() const
{
    return m_unplayableMessageLabel.data();
}

QRect ZafVideoEditorViewController::unplayableMessageFrame()
{
    // The whole view, less a margin so that long names wrap clear of the window's edges.
    return QRect(QPoint(0, 0), view()->size()).adjusted(24, 0, -24, 0);
}
