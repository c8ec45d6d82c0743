#include "publishing/plugin/publishing_plugin.h"

#include "publishing/plugin/signin/youtube_client.h"
#include "publishing/plugin/youtube_publishing_agent.h"
#include "publishing/plugin/youtube_publishing_form.h"

const QMetaObject *ZafPublishingPlugin::agentClassNamed(const QString &className) const
{
    if (className == QLatin1String(ZafYouTubePublishingAgent::staticMetaObject.className()))
        return &ZafYouTubePublishingAgent::staticMetaObject;
    return nullptr;
}

void ZafPublishingPlugin::setFormDefaultCategoryRoutine(std::function<void(QObject *form)> routine)
{
    if (!routine) {
        ZafYouTubePublishingForm::setDefaultCategoryRoutine({});
        return;
    }
    ZafYouTubePublishingForm::setDefaultCategoryRoutine(
        [routine = std::move(routine)](ZafYouTubePublishingForm *form) { routine(form); });
}

bool ZafPublishingPlugin::canSignIn() const
{
    return zaf::publishing::configuredYouTubeClient().has_value() || !qEnvironmentVariable("ZAF_YOUTUBE_ACCESS_TOKEN").trimmed().isEmpty();
}
