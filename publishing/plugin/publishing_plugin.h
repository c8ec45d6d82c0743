#pragma once

// The plug-in instance that the publishing plug-in library exports: the API version and the agent
// classes by name. Main thread only.

#include "publishing/publishing_agent.h"

#include <QObject>

class ZafPublishingPlugin : public QObject, public ZafPublishingPluginInterface {
    Q_OBJECT
    Q_PLUGIN_METADATA(IID ZafPublishingPluginInterface_iid)
    Q_INTERFACES(ZafPublishingPluginInterface)
public:
    explicit ZafPublishingPlugin(QObject *parent = nullptr) : QObject(parent) {}

    int apiVersion() const override { return kZafPublishingPluginApiVersion; }
    const QMetaObject *agentClassNamed(const QString &className) const override;
    void setFormDefaultCategoryRoutine(std::function<void(QObject *form)> routine) override;
    bool canSignIn() const override;
};
