#pragma once

// The publishing plug-in's agent, as the share action sees it, and the callbacks it sends.
//
// Threads: main thread only. Order of the delegate callbacks: WillBeDisplayed when the form comes on
// screen; DoneButtonClicked / CancelButtonClicked as the user presses them; DidBeginPublishing when
// the upload starts; DidEndPublishingError once when it ends (no error: success, mediaURL() holds
// the watch URL).

#include "platform/error.h"

#include <QObject>
#include <QString>
#include <QtPlugin>

#include <functional>
#include <optional>

namespace zaf::ui {
class ViewController;
}

class ZafPublishingAgent;

class ZafPublishingAgentDelegate {
public:
    virtual ~ZafPublishingAgentDelegate() = default;
    virtual void publishingAgentWillBeDisplayed(ZafPublishingAgent *agent) = 0;
    virtual void publishingAgentDoneButtonClicked(ZafPublishingAgent *agent) = 0;
    virtual void publishingAgentCancelButtonClicked(ZafPublishingAgent *agent) = 0;
    virtual void publishingAgentDidBeginPublishing(ZafPublishingAgent *agent) = 0;
    virtual void publishingAgentDidEndPublishingError(ZafPublishingAgent *agent, const std::optional<zaf::Error> &error) = 0;
    // Optional. Publish was pressed: the agent begins publishing when `proceed` is called (once, on
    // the main thread). The delegate may hold it back, e.g. until the media file is complete; the
    // default proceeds at once.
    virtual void publishingAgentWillBeginPublishing(ZafPublishingAgent *, std::function<void()> proceed) { proceed(); }
    virtual void publishingAgentDidStartRemaking(ZafPublishingAgent *) {}
    virtual void publishingAgentDidEndRemakingDidSucceed(ZafPublishingAgent *, bool) {}
};

class ZafPublishingAgent : public QObject {
    Q_OBJECT
public:
    using QObject::QObject;
    virtual void setDelegate(ZafPublishingAgentDelegate *delegate) = 0;
    virtual void setMediaPath(const QString &path) = 0;
    // Holds the form as its first view controller; presented by the share sheet.
    virtual zaf::ui::ViewController *navigationController() = 0;
    // After a successful upload: the watch URL of the published video.
    virtual QString mediaURL() const = 0;

Q_SIGNALS:
    // Main thread: bytes sent so far of the total, while publishing.
    void uploadProgress(qint64 sent, qint64 total);
};

// What the plug-in library exports (a Qt plug-in instance implementing this interface).
class ZafPublishingPluginInterface {
public:
    virtual ~ZafPublishingPluginInterface() = default;
    // Must equal kZafPublishingPluginApiVersion; a mismatching plug-in is refused.
    virtual int apiVersion() const = 0;
    // The meta-object of an agent class by its class name, or null.
    virtual const QMetaObject *agentClassNamed(const QString &className) const = 0;
    // Replaces the default-category routine of every publishing form of the process, for every later
    // call (the forms run it when their view loads, and on their "_selectComedyPickerRow" method).
    // The routine gets the form object; an empty function restores the form's own routine.
    // Main thread only.
    virtual void setFormDefaultCategoryRoutine(std::function<void(QObject *form)> routine) = 0;
    // True when publishing can sign in without the user setting anything up first: an OAuth client
    // is configured (a kept sign-in needs one too) or an access token is given. The share sheet
    // offers publishing only then. Any thread.
    virtual bool canSignIn() const = 0;
};

// The names by which the activity reaches the plug-in's form and agent at run time: the form's and
// agent's Q_PROPERTYs and Q_INVOKABLE methods carry these names (moc needs them spelt out there),
// and everything else on both sides uses the constants. A call the other side does not answer is
// logged by the activity, never silent.
inline constexpr const char *kZafFormTableProperty = "_table";                // QObject*, also its objectName
inline constexpr const char *kZafFormCategoriesProperty = "_categories";      // QVariantList of QVariantMap
inline constexpr const char *kZafFormPickerProperty = "_picker";              // QObject*, also its objectName
inline constexpr const char *kZafFormDefaultCategoryProperty = "_defaultCategory"; // QString category id
inline constexpr const char *kZafFormCategoryCellMethod = "_categoryCell";    // () -> QObject*
inline constexpr const char *kZafTableCellMethod = "cellForRowInSection";     // (int row, int section) -> QObject*
inline constexpr const char *kZafCellSetValueMethod = "setValue";             // (QString)
inline constexpr const char *kZafCellSetPlaceholderMethod = "setPlaceholderText"; // (QString)
inline constexpr const char *kZafCategoryCellSetLabelMethod = "setCategoryString"; // (QString)
inline constexpr const char *kZafPickerSelectRowMethod = "selectRowInComponentAnimated"; // (int row, int component, bool animated)
inline constexpr const char *kZafAgentCancelMethod = "cancelAction";          // ()

// The keys of one entry of the form's "_categories" list (a QVariantMap per category).
inline constexpr const char *kZafPublishingCategoryIdKey = "id";
inline constexpr const char *kZafPublishingCategoryLabelKey = "label";
// The file name of the publishing plug-in and the class name of its YouTube agent.
inline constexpr const char *kZafPublishingPluginFileName = "libzaf_publishing_plugin.so";
inline constexpr const char *kZafYouTubePublishingAgentClassName = "ZafYouTubePublishingAgent";

inline constexpr int kZafPublishingPluginApiVersion = 3;
#define ZafPublishingPluginInterface_iid "com.zafrel.VideoPublisher/3"
Q_DECLARE_INTERFACE(ZafPublishingPluginInterface, ZafPublishingPluginInterface_iid)
