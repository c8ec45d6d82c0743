#pragma once

// Loading the publishing plug-in and finding its agent class.
//
// The plug-in is loaded once per path and kept loaded for the life of the process; an agent class
// found by name is cached process-wide, so later look-ups cost a hash probe. A plug-in that does not
// implement ZafPublishingPluginInterface or reports another API version than
// kZafPublishingPluginApiVersion is refused, with the reason logged and returned.
// Main thread only.

#include "publishing/publishing_agent.h"

#include <QString>

namespace zaf::publishing {

template <typename T>
struct PluginLookup {
    T *value = nullptr;
    // Why the look-up failed; empty on success.
    QString errorText;

    bool ok() const { return value != nullptr; }
};

// The plug-in instance of the library at `path`.
PluginLookup<ZafPublishingPluginInterface> loadPublishingPlugin(const QString &path);
// The meta-object of the agent class `className` of the plug-in at `path` (make an agent with
// newInstance()). The answer, found or refused, is kept for the life of the process: the first call
// for a path and class loads the plug-in, every later one is a hash probe. So whether the share sheet
// offers publishing is decided once per process, and a plug-in put in place later is not seen.
PluginLookup<const QMetaObject> publishingAgentClass(const QString &path, const QString &className);
// The plug-in's place: $ZAF_PUBLISHING_PLUGIN_PATH when set, else PREFIX/lib/zafrel/plugins/ of an
// installed program, else the build tree's publishing/plugin/ (platform/install_layout.h).
QString defaultPublishingPluginPath();

} // namespace zaf::publishing
