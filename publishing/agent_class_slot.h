#pragma once

// The process-wide slot of the publishing agent class. Its first use loads the publishing plug-in
// from defaultPublishingPluginPath() and looks its YouTube agent class up by name; the plug-in stays
// loaded and the class stored for the life of the process. Either failure stops the process with
// the reason: without the plug-in there is nothing to publish with.
//
// Threads: main thread only (the slot is filled on first use, without a lock).

#include "publishing/publishing_agent.h"

#include <memory>

namespace zaf::publishing {

struct AgentClassSlot {
    ZafPublishingPluginInterface *plugin = nullptr;
    const QMetaObject *agentClass = nullptr;
};

// The filled slot; loads the plug-in on the first call of the process.
const AgentClassSlot &agentClassSlot();
// A new agent of the slot's class, made with no arguments; stops the process when the class makes
// something that is not a publishing agent.
std::unique_ptr<ZafPublishingAgent> newPublishingAgent();

} // namespace zaf::publishing
