#include "platform/ui/share_activity.h"

#include "platform/log.h"

#include <QWidget>

namespace zaf::ui {

Q_LOGGING_CATEGORY(lcShare, "zaf.share")

ShareActivity::ShareActivity(QObject *parent) : QObject(parent) {}

ShareActivity::~ShareActivity() = default;

QIcon ShareActivity::activityImage() const
{
    return {};
}

bool ShareActivity::canPerformWithActivityItems(const QVariantList &)
{
    return false;
}

void ShareActivity::prepareWithActivityItems(const QVariantList &activityItems)
{
    m_items = activityItems;
}

ViewController *ShareActivity::activityViewController()
{
    return nullptr;
}

void ShareActivity::performActivity()
{
    activityDidFinish(false);
}

void ShareActivity::activityDidFinish(bool completed)
{
    if (m_finished) {
        log::info(lcShare(), QStringLiteral("Activity %1 finished again; ignored").arg(activityType()));
        return;
    }
    m_finished = true;
    if (m_error)
        log::error(lcShare(), QStringLiteral("Activity %1 failed: %2").arg(activityType(), m_error->description()));
    else
        log::info(lcShare(), QStringLiteral("Activity %1 finished, completed %2").arg(activityType()).arg(completed));
    Q_EMIT activityFinished(completed);
}

void ShareActivity::setPresentationWidget(QWidget *widget)
{
    m_presentationWidget = widget;
}

QWidget *ShareActivity::presentationWidget() const
{
    return m_presentationWidget.data();
}

void ShareActivity::beginRun()
{
    m_finished = false;
    m_error.reset();
}

QList<QUrl> ShareActivity::fileURLsInItems(const QVariantList &activityItems)
{
    QList<QUrl> urls;
    for (const QVariant &item : activityItems) {
        if (item.metaType() == QMetaType::fromType<QUrl>()) {
            const QUrl url = item.toUrl();
            if (url.isLocalFile() && !url.toLocalFile().isEmpty())
                urls.append(url);
        }
    }
    return urls;
}

QStringList ShareActivity::textsInItems(const QVariantList &activityItems)
{
    QStringList texts;
    for (const QVariant &item : activityItems) {
        if (item.metaType() == QMetaType::fromType<QString>()) {
            const QString text = item.toString();
            if (!text.isEmpty())
                texts.append(text);
        }
    }
    return texts;
}

} // namespace zaf::ui
