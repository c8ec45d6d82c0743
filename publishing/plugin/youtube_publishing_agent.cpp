#include "publishing/plugin/youtube_publishing_agent.h"

#include "platform/log.h"
#include "platform/ui/bar_button_item.h"
#include "platform/ui/toolbar.h"
#include "publishing/plugin/signin/refresh_token_store.h"
#include "publishing/plugin/signin/youtube_client.h"
#include "publishing/plugin/youtube_publishing_form.h"

#include <QDesktopServices>
#include <QHostAddress>
#include <QNetworkAccessManager>
#include <QNetworkReply>
#include <QOAuth2AuthorizationCodeFlow>
#include <QOAuthHttpServerReplyHandler>
#include <QPushButton>
#include <QTimer>
#include <QVBoxLayout>

namespace {

Q_LOGGING_CATEGORY(lcPublishingAgent, "zaf.publishing.agent")

constexpr const char *kAgentErrorDomain = "zaf.publishing.agent";
enum AgentErrorCode { NoClientIdError = 1, AuthorizationError = 2, NoMediaError = 3, SignInTimeoutError = 4 };

constexpr const char *kDefaultApiBase = "https://www.googleapis.com";
constexpr const char *kAuthorizationUrl = "https://accounts.google.com/o/oauth2/auth";
constexpr const char *kTokenUrl = "https://oauth2.googleapis.com/token";
constexpr const char *kUploadScope = "https://www.googleapis.com/auth/youtube.upload";

QString environment(const char *name)
{
    return qEnvironmentVariable(name).trimmed();
}

} // namespace

ZafYouTubeNavigationController::ZafYouTubeNavigationController(QObject *parent) : zaf::ui::ViewController(parent) {}

void ZafYouTubeNavigationController::setToolbarItems(const QList<zaf::ui::BarButtonItem *> &items)
{
    m_items = items;
    if (m_toolbar)
        m_toolbar->setItems(m_items);
}

void ZafYouTubeNavigationController::loadView()
{
    auto *view = new QWidget;
    auto *layout = new QVBoxLayout(view);
    layout->setContentsMargins(0, 0, 0, 0);
    layout->setSpacing(0);
    m_toolbar = new zaf::ui::Toolbar(view);
    m_toolbar->setFixedHeight(44);
    m_toolbar->setItems(m_items);
    layout->addWidget(m_toolbar);
    const QList<zaf::ui::ViewController *> children = childViewControllers();
    if (!children.isEmpty())
        layout->addWidget(children.first()->view(), 1);
    setView(view);
}

void ZafYouTubeNavigationController::viewWillAppear(bool animated)
{
    zaf::ui::ViewController::viewWillAppear(animated);
    if (m_willAppear)
        m_willAppear();
}

ZafYouTubePublishingAgent::ZafYouTubePublishingAgent(QObject *parent)
    : ZafPublishingAgent(parent),
      m_navigation(new ZafYouTubeNavigationController(this)),
      m_form(new ZafYouTubePublishingForm(this)),
      m_network(new QNetworkAccessManager(this)),
      m_signInTimer(new QTimer(this))
{
    m_signInTimer->setSingleShot(true);
    connect(m_signInTimer, &QTimer::timeout, this, &ZafYouTubePublishingAgent::signInTimedOut);
    m_navigation->addChildViewController(m_form);
    m_navigation->didMoveToParentViewController(m_navigation);

    auto *publishButton = new QPushButton(tr("Publish"));
    connect(publishButton, &QPushButton::clicked, this, &ZafYouTubePublishingAgent::publishAction);
    m_publishItem = new zaf::ui::BarButtonItem(publishButton, m_navigation);
    m_navigation->setToolbarItems({
        new zaf::ui::BarButtonItem(zaf::ui::SystemItem::Cancel, this, &ZafYouTubePublishingAgent::cancelAction, m_navigation),
        new zaf::ui::BarButtonItem(zaf::ui::SystemItem::FlexibleSpace, m_navigation),
        m_publishItem,
        new zaf::ui::BarButtonItem(zaf::ui::SystemItem::Done, this, &ZafYouTubePublishingAgent::doneAction, m_navigation),
    });
    m_navigation->setWillAppearHandler([this] {
        if (m_delegate)
            m_delegate->publishingAgentWillBeDisplayed(this);
    });
}

ZafYouTubePublishingAgent::~ZafYouTubePublishingAgent()
{
    // The navigation view holds the form's view; let the form's controller go first so each view is
    // deleted once.
    if (m_upload)
        m_upload->disconnect(this);
    m_form->removeFromParentViewController();
    delete m_form;
    delete m_navigation;
}

zaf::ui::ViewController *ZafYouTubePublishingAgent::navigationController()
{
    return m_navigation;
}

void ZafYouTubePublishingAgent::cancelAction()
{
    // Publishing ends here, quietly: the delegate hears the Cancel, not an end of publishing.
    const bool wasPublishing = m_publishing || m_awaitingDelegate;
    m_publishing = false;
    m_awaitingDelegate = false;
    abandonSignIn();
    if (m_upload && m_upload->isRunning())
        m_upload->cancel();
    if (wasPublishing)
        m_publishItem->setEnabled(true);
    if (m_delegate)
        m_delegate->publishingAgentCancelButtonClicked(this);
}

void ZafYouTubePublishingAgent::doneAction()
{
    m_form->endEditing();
    if (m_delegate)
        m_delegate->publishingAgentDoneButtonClicked(this);
}

void ZafYouTubePublishingAgent::publishAction()
{
    if (m_publishing || m_awaitingDelegate)
        return;
    m_awaitingDelegate = true;
    m_publishItem->setEnabled(false);
    QPointer<ZafYouTubePublishingAgent> guard(this);
    auto proceed = [guard] {
        if (guard && guard->m_awaitingDelegate) {
            guard->m_awaitingDelegate = false;
            guard->beginPublishing();
        }
    };
    if (m_delegate)
        m_delegate->publishingAgentWillBeginPublishing(this, proceed);
    else
        proceed();
}

void ZafYouTubePublishingAgent::beginPublishing()
{
    if (m_publishing)
        return;
    m_publishing = true;
    m_mediaURL.clear();
    m_publishItem->setEnabled(false);
    m_form->endEditing();
    if (m_delegate)
        m_delegate->publishingAgentDidBeginPublishing(this);

    if (m_mediaPath.isEmpty()) {
        finishPublishing(zaf::Error{QString::fromLatin1(kAgentErrorDomain), NoMediaError,
                                    QStringLiteral("There is no movie to publish.")});
        return;
    }
    const QString token = environment("ZAF_YOUTUBE_ACCESS_TOKEN");
    if (!token.isEmpty())
        startUpload(token);
    else
        authorizeAndUpload();
}

void ZafYouTubePublishingAgent::authorizeAndUpload()
{
    const std::optional<zaf::publishing::YouTubeClient> client = zaf::publishing::configuredYouTubeClient();
    if (!client) {
        finishPublishing(zaf::Error{QString::fromLatin1(kAgentErrorDomain), NoClientIdError,
                                    QStringLiteral("Publishing to YouTube needs an OAuth client: run zaf-youtube-setup, "
                                                   "or write its id and secret into %1.")
                                        .arg(zaf::publishing::youTubeClientSettingsPath())});
        return;
    }
    if (m_oauth && !m_oauth->token().isEmpty()) {
        startUpload(m_oauth->token());
        return;
    }
    if (!m_oauth) {
        m_clientId = client->id;
        // The token endpoint can be another (a loopback server in tests), like the upload server.
        const QString tokenUrl = environment("ZAF_YOUTUBE_TOKEN_URL");
        m_oauth = new QOAuth2AuthorizationCodeFlow(client->id, QUrl(QString::fromLatin1(kAuthorizationUrl)),
                                                   QUrl(tokenUrl.isEmpty() ? QString::fromLatin1(kTokenUrl) : tokenUrl), m_network, this);
        m_oauth->setScope(QString::fromLatin1(kUploadScope));
        if (!client->secret.isEmpty())
            m_oauth->setClientIdentifierSharedKey(client->secret);
        auto *replyHandler = new QOAuthHttpServerReplyHandler(QHostAddress(QHostAddress::LocalHost), 0, m_oauth);
        m_oauth->setReplyHandler(replyHandler);
        connect(m_oauth, &QOAuth2AuthorizationCodeFlow::authorizeWithBrowser, this, [](const QUrl &url) {
            if (!QDesktopServices::openUrl(url))
                zaf::log::error(lcPublishingAgent(), QStringLiteral("Could not open the browser for authorization"));
        });
        connect(m_oauth, &QOAuth2AuthorizationCodeFlow::granted, this, [this] {
            m_signInTimer->stop();
            m_refreshing = false;
            // Kept in the secret store, so the next publish needs no browser.
            if (!m_oauth->refreshToken().isEmpty())
                zaf::publishing::storeRefreshToken(m_clientId, m_oauth->refreshToken());
            if (m_publishing && !(m_upload && m_upload->isRunning()))
                startUpload(m_oauth->token());
        });
        // A kept sign-in the service no longer accepts (revoked, expired): sign in in the browser.
        // The flow of this Qt version reports a refused refresh neither as an error nor as a status,
        // so the token endpoint's answer is watched on the network itself.
        const QUrl tokenEndpoint = m_oauth->accessTokenUrl();
        // Only an answer of the service's (4xx: the grant is invalid) forgets the kept sign-in; a
        // failure to reach it keeps it for the next publish.
        connect(m_network, &QNetworkAccessManager::finished, this, [this, tokenEndpoint](QNetworkReply *reply) {
            if (!m_refreshing || reply->url() != tokenEndpoint || reply->error() == QNetworkReply::NoError)
                return;
            const int status = reply->attribute(QNetworkRequest::HttpStatusCodeAttribute).toInt();
            if (status >= 400 && status < 500) {
                signInAfterARefusedRefresh();
                return;
            }
            m_refreshing = false;
            if (!m_publishing)
                return;
            abandonSignIn();
            finishPublishing(zaf::Error{QString::fromLatin1(kAgentErrorDomain), AuthorizationError,
                                        QStringLiteral("Could not reach the sign-in service: %1").arg(reply->errorString())});
        });
        connect(m_oauth, &QAbstractOAuth::statusChanged, this, [this](QAbstractOAuth::Status status) {
            if (m_refreshing && status == QAbstractOAuth::Status::NotAuthenticated)
                signInAfterARefusedRefresh();
        });
        connect(m_oauth, &QOAuth2AuthorizationCodeFlow::error, this,
                [this](const QString &error, const QString &description, const QUrl &) {
                    if (!m_publishing || (m_upload && m_upload->isRunning()))
                        return;
                    abandonSignIn();
                    finishPublishing(zaf::Error{QString::fromLatin1(kAgentErrorDomain), AuthorizationError,
                                                QStringLiteral("Authorization failed: %1 %2").arg(error, description)});
                });
        if (!replyHandler->isListening()) {
            abandonSignIn();
            finishPublishing(zaf::Error{QString::fromLatin1(kAgentErrorDomain), AuthorizationError,
                                        QStringLiteral("Could not listen on 127.0.0.1 for the authorization reply.")});
            return;
        }
    }
    m_signInTimer->start(m_signInTimeoutMs);
    // A sign-in kept from an earlier publish is refreshed without the browser.
    QPointer<ZafYouTubePublishingAgent> self(this);
    zaf::publishing::readRefreshToken(m_clientId, [self](const QString &refreshToken) {
        if (!self || !self->m_publishing || !self->m_oauth)
            return;
        if (refreshToken.isEmpty()) {
            self->m_oauth->grant();
            return;
        }
        self->m_refreshing = true;
        self->m_oauth->setRefreshToken(refreshToken);
        self->m_oauth->refreshAccessToken();
    });
}

void ZafYouTubePublishingAgent::signInAfterARefusedRefresh()
{
    m_refreshing = false;
    if (!m_publishing || !m_oauth)
        return;
    zaf::log::info(lcPublishingAgent(), QStringLiteral("The kept sign-in was refused; signing in in the browser"));
    zaf::publishing::forgetRefreshToken(m_clientId);
    m_oauth->grant();
}

void ZafYouTubePublishingAgent::abandonSignIn()
{
    m_signInTimer->stop();
    // A flow that has its token is a finished sign-in, kept for the next upload.
    if (!m_oauth || !m_oauth->token().isEmpty())
        return;
    // The loopback listener closes now; a browser that comes back later finds nobody there.
    if (auto *handler = qobject_cast<QOAuthHttpServerReplyHandler *>(m_oauth->replyHandler()))
        handler->close();
    m_oauth->disconnect(this);
    m_oauth->deleteLater();
    m_oauth = nullptr;
}

void ZafYouTubePublishingAgent::signInTimedOut()
{
    if (!m_publishing || !m_oauth)
        return;
    abandonSignIn();
    finishPublishing(zaf::Error{QString::fromLatin1(kAgentErrorDomain), SignInTimeoutError,
                                QStringLiteral("The sign-in in the browser did not finish within %1 seconds.")
                                    .arg(m_signInTimeoutMs / 1000.0)});
}

void ZafYouTubePublishingAgent::startUpload(const QString &accessToken)
{
    if (!m_upload) {
        m_upload = new zaf::publishing::ResumableUpload(m_network, this);
        connect(m_upload, &zaf::publishing::ResumableUpload::progress, this, &ZafPublishingAgent::uploadProgress);
        connect(m_upload, &zaf::publishing::ResumableUpload::finished, this,
                [this](const zaf::publishing::UploadResult &result) {
                    if (result.ok())
                        m_mediaURL = result.watchUrl.toString();
                    finishPublishing(result.error);
                });
    }
    const QString base = environment("ZAF_YOUTUBE_API_BASE");
    zaf::publishing::VideoMetadata metadata;
    metadata.title = m_form->title();
    metadata.description = m_form->description();
    metadata.categoryId = m_form->categoryId();
    metadata.privacyStatus = m_form->privacyStatus();

    m_upload->setBaseUrl(QUrl(base.isEmpty() ? QString::fromLatin1(kDefaultApiBase) : base));
    m_upload->setAccessToken(accessToken);
    m_upload->setFilePath(m_mediaPath);
    m_upload->setMetadata(metadata);
    m_upload->setChunkSize(m_chunkSize);
    zaf::log::info(lcPublishingAgent(), QStringLiteral("Publishing %1 in category %2").arg(m_mediaPath, metadata.categoryId));
    m_upload->start();
}

void ZafYouTubePublishingAgent::finishPublishing(const zaf::OptionalError &error)
{
    if (!m_publishing)
        return;
    m_publishing = false;
    m_publishItem->setEnabled(true);
    if (error)
        zaf::log::error(lcPublishingAgent(), QStringLiteral("Publishing failed: %1").arg(error->description()));
    if (m_delegate)
        m_delegate->publishingAgentDidEndPublishingError(this, error);
}
