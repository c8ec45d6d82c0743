// Sharing: the share item opens the share sheet with the current movie.
#include "editor/editor.h"

#include "platform/log.h"

void ZafVideoEditorViewController::shareAction()
{
    displayShareSheetWithVideoURL(m_videoURL);
}

void ZafVideoEditorViewController::displayShareSheetWithVideoURL(const QUrl &url)
{
    // The share sheet comes with its own subsystem; until then the item says so in the log.
    zaf::log::notice(lcEditor(), QStringLiteral("share sheet not available yet for %1").arg(url.toLocalFile()));
}

void ZafVideoEditorViewController::shareSheetDidCompleteWithActivityType(const QString &activityType, bool completed)
{
    m_shareSheetUp = false;
    if (completed && !activityType.isEmpty())
        m_activityTypes.append(activityType);
}
