#include "platform/extensionkit/extension_runtime.h"

#include "platform/extensionkit/channel.h"
#include "platform/extensionkit/extensionkit_log.h"
#include "platform/extensionkit/json_rpc.h"
#include "platform/extensionkit/protocol_version.h"
#include "platform/log.h"
#include "platform/ui/view_controller.h"
#include "platform/ui/window_host.h"

#include <QApplication>
#include <QJsonArray>
#include <QJsonObject>
#include <QLibraryInfo>
#include <QLocale>
#include <QTranslator>

#include <cerrno>
#include <csignal>
#include <fcntl.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <unistd.h>

namespace zaf::extensionkit {

namespace {

constexpr const char *kBeginRequestMethod = "beginExtensionRequest";
constexpr const char *kRemoveViewMethod = "removeExtensionView";

} // namespace

struct ExtensionRuntime::Private {
    int fd = -1;
    ExtensionDeclaration declaration;
    std::shared_ptr<Channel> channel;
    std::unique_ptr<ExtensionContext> context;
    std::unique_ptr<zaf::ui::ViewController> principal;
    std::unique_ptr<zaf::ui::WindowHost> window;
    bool started = false;
    bool requestBegun = false;
    bool finished = false;
};

ExtensionRuntime::ExtensionRuntime(int channelFd, ExtensionDeclaration declaration, QObject *parent)
    : QObject(parent), d(std::make_unique<Private>())
{
    d->fd = channelFd;
    d->declaration = std::move(declaration);
}

ExtensionRuntime::~ExtensionRuntime()
{
    if (d->channel)
        d->channel->disconnect(this);
    // The window gives the principal its view back, the principal goes before its context, and the
    // channel last (proxies may still hold it: it is closed, not necessarily deleted).
    d->window.reset();
    d->principal.reset();
    if (d->context)
        d->context->setChannel(nullptr);
    d->context.reset();
    if (d->channel) {
        d->channel->close(QStringLiteral("the extension runtime ended"));
        d->channel.reset();
    } else if (d->fd >= 0) {
        // Never started: the descriptor is still ours to close.
        ::close(d->fd);
    }
    d->fd = -1;
}

bool ExtensionRuntime::start(QString *error)
{
    auto fail = [&](const QString &text) {
        log::error(lcExtensionKit(), QStringLiteral("extension runtime: %1").arg(text));
        if (error)
            *error = text;
        return false;
    };
    if (d->started)
        return fail(QStringLiteral("already started"));
    if (d->fd < 0)
        return fail(QStringLiteral("no channel descriptor"));
    d->started = true;

    d->channel = Channel::create(d->fd);
    d->fd = -1; // the channel owns it now
    QString channelError;
    if (!d->channel->start(&channelError))
        return fail(QStringLiteral("the channel is unusable: %1").arg(channelError));

    d->context.reset(d->declaration.makeContext ? d->declaration.makeContext() : new ExtensionContext);
    if (!d->context)
        return fail(QStringLiteral("the declaration made no context (%1)").arg(d->declaration.contextClassName));
    d->principal.reset(d->declaration.makePrincipal ? d->declaration.makePrincipal() : nullptr);
    if (!d->principal)
        return fail(QStringLiteral("the declaration made no principal (%1)").arg(d->declaration.principalClassName));
    d->context->setChannel(d->channel);
    d->context->setPrincipalObject(d->principal.get());
    log::info(lcExtensionKit(), QStringLiteral("extension runtime: context %1, principal %2; waiting for the request")
                                  .arg(d->declaration.contextClassName, d->declaration.principalClassName));

    Channel *channel = d->channel.get();
    connect(channel, &Channel::requestReceived, this, [this](const QJsonValue &id, const QString &method, const QJsonValue &params) {
        handleRequest(id, method, params);
    });
    connect(channel, &Channel::notificationReceived, this, [this](const QString &method, const QJsonValue &params) {
        handleNotification(method, params);
    });
    connect(channel, &Channel::closed, this, [this](const QString &reason) {
        removeView(QStringLiteral("the channel closed (%1)").arg(reason));
    });
    return true;
}

ExtensionContext *ExtensionRuntime::context() const
{
    return d->context.get();
}

zaf::ui::ViewController *ExtensionRuntime::principal() const
{
    return d->principal.get();
}

zaf::ui::WindowHost *ExtensionRuntime::window() const
{
    return d->window.get();
}

bool ExtensionRuntime::hasRequest() const
{
    return d->requestBegun;
}

bool ExtensionRuntime::isFinished() const
{
    return d->finished;
}

void ExtensionRuntime::handleRequest(const QJsonValue &id, const QString &method, const QJsonValue &params)
{
    auto answerError = [&](int code, const QString &text) {
        log::error(lcExtensionKit(), QStringLiteral("request %1 refused (%2): %3").arg(method, jsonrpc::errorCodeName(code), text));
        if (const OptionalError error = d->channel->sendError(id, code, text))
            log::error(lcExtensionKit(), QStringLiteral("cannot answer request %1: %2").arg(method, error->description()));
    };
    if (method == QLatin1String(kBeginRequestMethod)) {
        if (d->finished) {
            answerError(jsonrpc::InvalidRequest, QStringLiteral("the extension view has been removed"));
            return;
        }
        if (d->requestBegun) {
            answerError(jsonrpc::InvalidRequest, QStringLiteral("request already begun"));
            return;
        }
        const QJsonValue items = params.toObject().value(QLatin1String("inputItems"));
        if (!params.isObject() || !items.isArray()) {
            answerError(jsonrpc::InvalidParams, QStringLiteral("beginExtensionRequest needs params {\"inputItems\": [...]}"));
            return;
        }
        const QJsonValue versionValue = params.toObject().value(QLatin1String(kProtocolVersionKey));
        std::optional<ProtocolVersion> hostVersion = kUnversionedProtocolVersion;
        if (!versionValue.isUndefined())
            hostVersion = parseProtocolVersion(versionValue.toString());
        if (!hostVersion) {
            const QString given = versionValue.isString() ? QStringLiteral("\"%1\"").arg(versionValue.toString())
                                                          : QStringLiteral("a value that is no string");
            answerError(jsonrpc::InvalidParams, QStringLiteral("protocolVersion must be a string \"MAJOR.MINOR\", not %1").arg(given));
            return;
        }
        if (!isCompatibleProtocolVersion(kProtocolVersion, *hostVersion)) {
            // The request is not begun: the host may ask again with a version this extension speaks.
            const QString text = QStringLiteral("unsupported protocol version %1: this editor speaks %2")
                                     .arg(hostVersion->toString(), kProtocolVersion.toString());
            log::error(lcExtensionKit(), QStringLiteral("request %1 refused: %2").arg(method, text));
            const QJsonObject ours{{QLatin1String(kProtocolVersionKey), kProtocolVersion.toString()}};
            if (const OptionalError error = d->channel->sendError(id, jsonrpc::UnsupportedProtocolVersion, text, ours))
                log::error(lcExtensionKit(), QStringLiteral("cannot answer request %1: %2").arg(method, error->description()));
            return;
        }
        d->requestBegun = true;
        const QList<InputItem> inputItems = inputItemsFromJson(items.toArray());
        d->context->setInputItems(inputItems);
        log::notice(lcExtensionKit(), QStringLiteral("request begun with %1 input items, protocol %2 (ours %3)")
                                          .arg(inputItems.size())
                                          .arg(hostVersion->toString(), kProtocolVersion.toString()));
        const QJsonObject answer{{QStringLiteral("accepted"), true},
                                 {QLatin1String(kProtocolVersionKey), kProtocolVersion.toString()}};
        if (const OptionalError error = d->channel->sendResult(id, answer))
            log::error(lcExtensionKit(), QStringLiteral("cannot accept the request: %1").arg(error->description()));
        showPrincipal();
        return;
    }
    if (method == QLatin1String(kRemoveViewMethod)) {
        answerError(jsonrpc::InvalidRequest, QStringLiteral("removeExtensionView is a notification and takes no id"));
        return;
    }
    answerError(jsonrpc::MethodNotFound, QStringLiteral("method not found: %1").arg(method));
}

void ExtensionRuntime::handleNotification(const QString &method, const QJsonValue &params)
{
    Q_UNUSED(params);
    if (method == QLatin1String(kRemoveViewMethod)) {
        removeView(QStringLiteral("the host removed the view"));
        return;
    }
    if (method == QLatin1String(kBeginRequestMethod)) {
        log::error(lcExtensionKit(), QStringLiteral("beginExtensionRequest sent as a notification (it needs an id); ignored"));
        return;
    }
    log::error(lcExtensionKit(), QStringLiteral("unknown notification %1; ignored").arg(method));
}

void ExtensionRuntime::showPrincipal()
{
    if (d->window || d->finished)
        return;
    // Making the window loads the principal's view: viewDidLoad runs here, with the items set.
    d->window = std::make_unique<zaf::ui::WindowHost>(d->principal.get());
    d->window->setWindowTitle(d->declaration.windowTitle);
    if (d->declaration.windowSize.isValid())
        d->window->resize(d->declaration.windowSize);
    d->window->setCloseHandler([this] {
        log::notice(lcExtensionKit(), QStringLiteral("the user closed the extension window"));
        if (d->declaration.onWindowClosed)
            d->declaration.onWindowClosed(d->principal.get());
    });
    d->window->show();
}

void ExtensionRuntime::removeView(const QString &reason)
{
    if (d->finished)
        return;
    d->finished = true;
    log::notice(lcExtensionKit(), QStringLiteral("removing the extension view: %1").arg(reason));
    // Hiding the window runs the principal's viewWillDisappear and viewDidDisappear.
    if (d->window && d->window->isVisible())
        d->window->hide();
    Q_EMIT finished();
}

int channelFdFromEnvironment(QString *error)
{
    auto fail = [&](const QString &text) {
        if (error)
            *error = text;
        return -1;
    };
    const QByteArray text = qgetenv(kChannelFdEnvironmentVariable);
    if (text.isEmpty())
        return fail(QStringLiteral("%1 is not set; this program is started by its host application").arg(kChannelFdEnvironmentVariable));
    bool ok = false;
    const int fd = text.toInt(&ok, 10);
    if (!ok || fd < 0)
        return fail(QStringLiteral("%1 is not a descriptor number: \"%2\"").arg(kChannelFdEnvironmentVariable, QString::fromLatin1(text.left(32))));
    struct stat info {};
    if (::fstat(fd, &info) != 0)
        return fail(QStringLiteral("%1=%2 names no open descriptor: %3").arg(kChannelFdEnvironmentVariable).arg(fd).arg(Error::fromErrno(errno).message));
    if (!S_ISSOCK(info.st_mode))
        return fail(QStringLiteral("%1=%2 is not a socket").arg(kChannelFdEnvironmentVariable).arg(fd));
    return fd;
}

int extensionMain(int argc, char **argv, const ExtensionDeclaration &declaration)
{
    // A host that has gone away must not kill the process: writes report EPIPE instead.
    std::signal(SIGPIPE, SIG_IGN);

    QString fdError;
    const int fd = channelFdFromEnvironment(&fdError);
    if (fd < 0) {
        log::error(lcExtensionKit(), QStringLiteral("cannot start the extension: %1").arg(fdError));
        log::console(QStringLiteral("error: %1").arg(fdError));
        return kExitCodeNoChannel;
    }

    QApplication app(argc, argv);
    // The window closing is Cancel, not the end: the process ends after the host removes the view.
    app.setQuitOnLastWindowClosed(false);

    // Qt's own texts (standard buttons, dialogs) in the user's language.
    auto *qtTranslator = new QTranslator(&app);
    const QString translations = QLibraryInfo::path(QLibraryInfo::TranslationsPath);
    if (qtTranslator->load(QLocale(), QStringLiteral("qtbase"), QStringLiteral("_"), translations))
        app.installTranslator(qtTranslator);
    else
        log::info(lcExtensionKit(), QStringLiteral("no qtbase translation for %1 in %2").arg(QLocale().name(), translations));

    if (declaration.prepareProcess)
        declaration.prepareProcess();

    ExtensionRuntime runtime(fd, declaration);
    QObject::connect(&runtime, &ExtensionRuntime::finished, &app, [] { QCoreApplication::exit(0); }, Qt::QueuedConnection);
    QString startError;
    if (!runtime.start(&startError)) {
        log::console(QStringLiteral("error: %1").arg(startError));
        return kExitCodeNoChannel;
    }
    return app.exec();
}

} // namespace zaf::extensionkit
