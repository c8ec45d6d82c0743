#pragma once

// The extension runtime: the process side of the host protocol (see the README's "The host
// protocol"). It reads framed JSON-RPC messages from the channel socket, decodes the request's input
// items into the context, creates the context and the principal view controller from the extension's
// declaration, shows the principal's view in a window, and on the host's removal of the view (or a
// closed channel) makes that view disappear and finishes.
//
// Threads: main thread only (socket reads via the event loop); every signal and every callback of
// the principal runs on the main thread.
//
// Order:
//   1. start(): the channel starts reading; the context and the principal are created and wired
//      (context->principalObject(), ExtensionContext::contextOfPrincipal(principal)). The
//      principal's view is NOT loaded yet and there is no window.
//   2. beginExtensionRequest arrives: the items are set on the context, the request is answered
//      {"accepted": true, "protocolVersion": ...}, and only then the window is made and shown: the principal's loadView and
//      viewDidLoad run now, so inputItems() is already complete when viewDidLoad starts loading the
//      items; viewWillAppear, viewDidLayoutSubviews, viewDidAppear follow as the window shows.
//   3. removeExtensionView arrives or the channel closes (whichever comes first; the other is then
//      ignored): a shown window is hidden through the appearance transition (viewWillDisappear,
//      viewDidDisappear on the principal), then finished() is emitted, once. A channel that closes
//      before any request finishes at once, without any view callback.
// Malformed messages are logged and answered with a JSON-RPC error when they carried an id; an
// oversized frame closes the channel (step 3). Unknown requests get -32601, unknown notifications
// are logged. A second beginExtensionRequest gets -32600 "request already begun". A request in
// another major protocol version than ours gets -32001 and is not begun (protocol_version.h).

#include "platform/extensionkit/extension_context.h"

#include <QJsonValue>
#include <QObject>
#include <QSize>
#include <QString>

#include <functional>
#include <memory>

namespace zaf::ui {
class ViewController;
class WindowHost;
} // namespace zaf::ui

namespace zaf::extensionkit {

// What the extension declares: its context and principal classes (by factory, named for logs), the
// window title and size. The principal's view is shown inside a window of that title.
struct ExtensionDeclaration {
    QString contextClassName;
    QString principalClassName;
    std::function<ExtensionContext *()> makeContext;
    std::function<zaf::ui::ViewController *()> makePrincipal;
    // Runs once at process start, on the main thread, before anything else (e.g. making the
    // temporary directory ready).
    std::function<void()> prepareProcess;
    QString windowTitle;
    QSize windowSize{1280, 720};
    // Called when the user closes the window (the extension maps it to its Cancel); null: ignored.
    std::function<void(zaf::ui::ViewController *principal)> onWindowClosed;
};

class ExtensionRuntime : public QObject {
    Q_OBJECT
public:
    // Takes ownership of the connected socket descriptor.
    ExtensionRuntime(int channelFd, ExtensionDeclaration declaration, QObject *parent = nullptr);
    ~ExtensionRuntime() override;

    // Starts reading the channel and creates the context and the principal (step 1 above); the
    // window follows the request. False (with `error` filled) when the channel is unusable, the
    // declaration makes no principal, or start() was already called.
    bool start(QString *error = nullptr);
    // Owned by the runtime; null before start().
    ExtensionContext *context() const;
    zaf::ui::ViewController *principal() const;
    // Null until beginExtensionRequest has arrived.
    zaf::ui::WindowHost *window() const;
    // Whether beginExtensionRequest has been accepted, and whether finished() has been emitted.
    bool hasRequest() const;
    bool isFinished() const;

Q_SIGNALS:
    // Main thread: the principal's view has disappeared after the host removed it or the channel
    // closed; the process may end. Emitted once. Slots must not delete the runtime directly (use
    // deleteLater()).
    void finished();

private:
    void handleRequest(const QJsonValue &id, const QString &method, const QJsonValue &params);
    void handleNotification(const QString &method, const QJsonValue &params);
    void showPrincipal();
    void removeView(const QString &reason);

    struct Private;
    std::unique_ptr<Private> d;
};

// The name of the environment variable that holds the channel's descriptor number.
inline constexpr const char *kChannelFdEnvironmentVariable = "ZAF_EXTENSION_CHANNEL_FD";
// The exit code when the channel is missing or unusable.
inline constexpr int kExitCodeNoChannel = 2;

// Reads the channel's descriptor from the environment: a decimal number naming an open socket.
// -1, with `error` filled, otherwise. Any thread.
int channelFdFromEnvironment(QString *error = nullptr);

// The extension main routine: ignores SIGPIPE (so a vanished host cannot kill the process), checks
// the channel from ZAF_EXTENSION_CHANNEL_FD, makes a QApplication with Qt's own translations for the
// current locale installed, runs prepareProcess, starts the runtime (window title and size from the
// declaration) and the event loop; returns the process's exit code: 0 after the view's removal or
// the channel's end, kExitCodeNoChannel when the descriptor is missing or unusable. Main thread.
int extensionMain(int argc, char **argv, const ExtensionDeclaration &declaration);

} // namespace zaf::extensionkit
