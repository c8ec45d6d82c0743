#include "publishing/plugin_loader.h"

#include "platform/install_layout.h"
#include "platform/log.h"

#include <QCoreApplication>
#include <QDir>
#include <QFileInfo>
#include <QHash>
#include <QPluginLoader>

namespace zaf::publishing {

namespace {

Q_LOGGING_CATEGORY(lcPluginLoader, "zaf.publishing.plugin")

struct PluginCache {
    QHash<QString, ZafPublishingPluginInterface *> plugins;  // by canonical path
    QHash<QString, const QMetaObject *> agentClasses;         // by canonical path + '\n' + class name
    QHash<QString, QString> refusedAgentClasses;              // the same keys: why the look-up failed
};

PluginCache &cache()
{
    static PluginCache instance;
    return instance;
}

QString cacheKey(const QString &path)
{
    const QString canonical = QFileInfo(path).canonicalFilePath();
    return canonical.isEmpty() ? path : canonical;
}

template <typename T>
PluginLookup<T> refuse(const QString &reason)
{
    zaf::log::error(lcPluginLoader(), reason);
    return PluginLookup<T>{nullptr, reason};
}

} // namespace

PluginLookup<ZafPublishingPluginInterface> loadPublishingPlugin(const QString &path)
{
    const QString key = cacheKey(path);
    if (ZafPublishingPluginInterface *plugin = cache().plugins.value(key))
        return {plugin, {}};

    // The loader is never unloaded: agents and their meta-objects live in the library.
    auto *loader = new QPluginLoader(path, QCoreApplication::instance());
    loader->setLoadHints(QLibrary::ResolveAllSymbolsHint);
    QObject *instance = loader->instance();
    if (!instance) {
        const QString reason = QStringLiteral("Cannot load the publishing plug-in %1: %2").arg(path, loader->errorString());
        delete loader;
        return refuse<ZafPublishingPluginInterface>(reason);
    }
    auto *plugin = qobject_cast<ZafPublishingPluginInterface *>(instance);
    if (!plugin) {
        loader->unload();
        delete loader;
        return refuse<ZafPublishingPluginInterface>(
            QStringLiteral("%1 is not a publishing plug-in (no %2 interface)").arg(path, QLatin1String(ZafPublishingPluginInterface_iid)));
    }
    if (plugin->apiVersion() != kZafPublishingPluginApiVersion) {
        const QString reason = QStringLiteral("The publishing plug-in %1 has API version %2, this program needs %3")
                                   .arg(path).arg(plugin->apiVersion()).arg(kZafPublishingPluginApiVersion);
        loader->unload();
        delete loader;
        return refuse<ZafPublishingPluginInterface>(reason);
    }
    zaf::log::info(lcPluginLoader(), QStringLiteral("Loaded the publishing plug-in %1").arg(path));
    cache().plugins.insert(key, plugin);
    return {plugin, {}};
}

PluginLookup<const QMetaObject> publishingAgentClass(const QString &path, const QString &className)
{
    const QString key = cacheKey(path) + QLatin1Char('\n') + className;
    if (const QMetaObject *agentClass = cache().agentClasses.value(key))
        return {agentClass, {}};
    if (const auto refused = cache().refusedAgentClasses.constFind(key); refused != cache().refusedAgentClasses.cend())
        return {nullptr, refused.value()};

    const auto remember = [&key](PluginLookup<const QMetaObject> lookup) {
        if (!lookup.ok())
            cache().refusedAgentClasses.insert(key, lookup.errorText);
        return lookup;
    };
    const PluginLookup<ZafPublishingPluginInterface> plugin = loadPublishingPlugin(path);
    if (!plugin.ok())
        return remember({nullptr, plugin.errorText});
    const QMetaObject *agentClass = plugin.value->agentClassNamed(className);
    if (!agentClass)
        return remember(refuse<const QMetaObject>(QStringLiteral("The publishing plug-in %1 has no agent class %2").arg(path, className)));
    if (!agentClass->inherits(&ZafPublishingAgent::staticMetaObject))
        return remember(refuse<const QMetaObject>(QStringLiteral("%1 of %2 is not a publishing agent").arg(className, path)));
    cache().agentClasses.insert(key, agentClass);
    return {agentClass, {}};
}

QString defaultPublishingPluginPath()
{
    return install::dataPath("ZAF_PUBLISHING_PLUGIN_PATH",
                             QLatin1String(install::kPluginsDir) + QStringLiteral("/libzaf_publishing_plugin.so"),
                             QStringLiteral(ZAF_PUBLISHING_PLUGIN_FILE));
}

} // namespace zaf::publishing
