#include "publishing/agent_class_slot.h"

#include "publishing/plugin_loader.h"

namespace zaf::publishing {

const AgentClassSlot &agentClassSlot()
{
    static AgentClassSlot slot;
    if (slot.agentClass)
        return slot;
    const QString path = defaultPublishingPluginPath();
    const auto plugin = loadPublishingPlugin(path);
    if (!plugin.ok())
        qFatal("%s", qPrintable(plugin.errorText));
    const auto agentClass = publishingAgentClass(path, QLatin1String(kZafYouTubePublishingAgentClassName));
    if (!agentClass.ok())
        qFatal("Unable to find class %s", kZafYouTubePublishingAgentClassName);
    slot.plugin = plugin.value;
    slot.agentClass = agentClass.value;
    return slot;
}

std::unique_ptr<ZafPublishingAgent> newPublishingAgent()
{
    QObject *instance = agentClassSlot().agentClass->newInstance();
    auto *agent = qobject_cast<ZafPublishingAgent *>(instance);
    if (!agent) {
        delete instance;
        qFatal("Unable to find class %s", kZafYouTubePublishingAgentClassName);
    }
    return std::unique_ptr<ZafPublishingAgent>(agent);
}

} // namespace zaf::publishing
