#pragma once

// Helpers for the tests that drive the publishing agent: calls by name on its form, the environment
// that makes it sign in (a client id, no access token), and a stand-in for the browser that takes
// the authorization page the process opens instead of starting a desktop browser. Main thread only.

#include "platform/ui/view_controller.h"
#include "publishing/plugin_loader.h"
#include "publishing/publishing_agent.h"

#include <QDesktopServices>
#include <QObject>
#include <QStringList>
#include <QTcpSocket>
#include <QUrl>
#include <QUrlQuery>

#include <memory>
#include <optional>

namespace zaf::test {

inline QObject *invokeForObject(QObject *target, const char *method)
{
    QObject *result = nullptr;
    QMetaObject::invokeMethod(target, method, Q_RETURN_ARG(QObject *, result));
    return result;
}

inline QString invokeForString(QObject *target, const char *method)
{
    QString result;
    QMetaObject::invokeMethod(target, method, Q_RETURN_ARG(QString, result));
    return result;
}

// The agent's form, the first view controller of its navigation; null when it has none.
inline ui::ViewController *formOf(ZafPublishingAgent *agent)
{
    const QList<ui::ViewController *> children = agent ? agent->navigationController()->childViewControllers() : QList<ui::ViewController *>();
    return children.isEmpty() ? nullptr : children.first();
}

// A new agent of the built plug-in (ZAF_PUBLISHING_PLUGIN_PATH) with its form's view loaded, as
// when the form is presented; null when the plug-in does not load.
inline std::unique_ptr<ZafPublishingAgent> makeAgent()
{
    const auto agentClass = zaf::publishing::publishingAgentClass(QStringLiteral(ZAF_PUBLISHING_PLUGIN_PATH),
                                                                  QLatin1String(kZafYouTubePublishingAgentClassName));
    if (!agentClass.ok())
        return nullptr;
    std::unique_ptr<ZafPublishingAgent> agent(qobject_cast<ZafPublishingAgent *>(agentClass.value->newInstance()));
    if (auto *form = formOf(agent.get()))
        form->view();
    return agent;
}

class BrowserStub : public QObject {
    Q_OBJECT
public:
    BrowserStub() { QDesktopServices::setUrlHandler(QStringLiteral("https"), this, "open"); }
    ~BrowserStub() override { QDesktopServices::unsetUrlHandler(QStringLiteral("https")); }

    // The loopback port the last authorization page sends the browser back to; 0 when none.
    quint16 redirectPort() const
    {
        return opened.isEmpty() ? 0 : quint16(QUrl(QUrlQuery(opened.last()).queryItemValue(QStringLiteral("redirect_uri"),
                                                                                             QUrl::FullyDecoded)).port(0));
    }

    QList<QUrl> opened;

public Q_SLOTS:
    void open(const QUrl &url) { opened << url; }
};

// Publishing signs in with a client id for as long as this lives; the browser is a BrowserStub.
struct SignInEnvironment {
    SignInEnvironment()
    {
        qunsetenv("ZAF_YOUTUBE_ACCESS_TOKEN");
        qputenv("ZAF_YOUTUBE_CLIENT_ID", "test-client");
    }
    ~SignInEnvironment() { qunsetenv("ZAF_YOUTUBE_CLIENT_ID"); }

    BrowserStub browser;
};

// The agent's delegate, recording its calls in order ("displayed", "done", "cancel", "begin",
// "end") and the error publishing ended with.
class RecordingDelegate : public ZafPublishingAgentDelegate {
public:
    void publishingAgentWillBeDisplayed(ZafPublishingAgent *) override { events << QStringLiteral("displayed"); }
    void publishingAgentDoneButtonClicked(ZafPublishingAgent *) override { events << QStringLiteral("done"); }
    void publishingAgentCancelButtonClicked(ZafPublishingAgent *) override { events << QStringLiteral("cancel"); }
    void publishingAgentDidBeginPublishing(ZafPublishingAgent *) override { events << QStringLiteral("begin"); }
    void publishingAgentDidEndPublishingError(ZafPublishingAgent *, const std::optional<zaf::Error> &e) override
    {
        events << QStringLiteral("end");
        error = e;
    }

    QStringList events;
    std::optional<zaf::Error> error;
};

// Whether something listens on 127.0.0.1:port.
inline bool acceptsConnections(quint16 port)
{
    QTcpSocket socket;
    socket.connectToHost(QStringLiteral("127.0.0.1"), port);
    return socket.waitForConnected(2000);
}

} // namespace zaf::test
