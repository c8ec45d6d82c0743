#pragma once

// Helpers for the browser sign-in tests: the environment that makes the agent sign in (a client id,
// no access token), and a stand-in for the browser that takes the authorization page the process
// opens instead of starting a desktop browser. Main thread only.

#include <QDesktopServices>
#include <QObject>
#include <QTcpSocket>
#include <QUrl>
#include <QUrlQuery>

namespace zaf::test {

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

// Whether something listens on 127.0.0.1:port.
inline bool acceptsConnections(quint16 port)
{
    QTcpSocket socket;
    socket.connectToHost(QStringLiteral("127.0.0.1"), port);
    return socket.waitForConnected(2000);
}

} // namespace zaf::test
