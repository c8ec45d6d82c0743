#pragma once

// The YouTube publishing agent of the plug-in: a navigation controller holding the form, with
// Cancel, Publish and Done on its toolbar, and the upload of the media file with the form's values.
//
// Publishing: the access token comes from $ZAF_YOUTUBE_ACCESS_TOKEN when it is set, otherwise from an
// OAuth 2.0 authorization code flow for the client the user set up (signin/youtube_client.h): a
// refresh token kept in the desktop's secret store from an earlier sign-in is refreshed without the
// browser; otherwise (or when the service refuses it) the sign-in runs in the browser with a loopback
// (127.0.0.1) redirect, and its refresh token is kept for next time. Without a client, publishing
// ends at once with an error. The service's base URL is $ZAF_YOUTUBE_API_BASE (default
// https://www.googleapis.com).
//
// The browser sign-in is given signInTimeoutMs (five minutes unless set otherwise): a sign-in the
// person abandons in the browser then ends publishing with an error, and its loopback listener is
// closed. Cancel works at any time: during the sign-in and the upload it stops them, and the agent
// reports only the Cancel (no end of publishing); a sign-in answer that arrives afterwards is ignored.
//
// Delegate callbacks, in order: WillBeDisplayed when the navigation view appears; Cancel/Done as the
// buttons are pressed; DidBeginPublishing when Publish starts; DidEndPublishingError once when the
// upload (or the authorization before it) ends. Main thread only.

#include "publishing/plugin/upload/resumable_upload.h"
#include "publishing/publishing_agent.h"
#include "platform/ui/toolbar.h"
#include "platform/ui/view_controller.h"

#include <QPointer>

class QNetworkAccessManager;
class QOAuth2AuthorizationCodeFlow;
class QTimer;
class ZafYouTubePublishingForm;

namespace zaf::ui {
class BarButtonItem;
}

// The agent's navigation controller: a toolbar above the view of its first child, the form.
class ZafYouTubeNavigationController : public zaf::ui::ViewController {
    Q_OBJECT
public:
    explicit ZafYouTubeNavigationController(QObject *parent = nullptr);

    void setToolbarItems(const QList<zaf::ui::BarButtonItem *> &items);
    zaf::ui::Toolbar *toolbar() const { return m_toolbar; }
    // Runs when the view is about to appear.
    void setWillAppearHandler(std::function<void()> handler) { m_willAppear = std::move(handler); }

    void loadView() override;
    void viewWillAppear(bool animated) override;

private:
    QPointer<zaf::ui::Toolbar> m_toolbar;
    QList<zaf::ui::BarButtonItem *> m_items;
    std::function<void()> m_willAppear;
};

class ZafYouTubePublishingAgent : public ZafPublishingAgent {
    Q_OBJECT
    // How long the browser sign-in may take, in milliseconds; set before publishing.
    Q_PROPERTY(int signInTimeoutMs READ signInTimeoutMs WRITE setSignInTimeoutMs)
public:
    static constexpr int kDefaultSignInTimeoutMs = 5 * 60 * 1000;

    Q_INVOKABLE explicit ZafYouTubePublishingAgent(QObject *parent = nullptr);
    ~ZafYouTubePublishingAgent() override;

    void setDelegate(ZafPublishingAgentDelegate *delegate) override { m_delegate = delegate; }
    void setMediaPath(const QString &path) override { m_mediaPath = path; }
    zaf::ui::ViewController *navigationController() override;
    QString mediaURL() const override { return m_mediaURL; }

    ZafYouTubePublishingForm *form() const { return m_form; }
    bool isPublishing() const { return m_publishing; }
    // The upload's chunk size (tests use small chunks).
    void setChunkSize(qint64 bytes) { m_chunkSize = bytes; }
    int signInTimeoutMs() const { return m_signInTimeoutMs; }
    void setSignInTimeoutMs(int milliseconds) { m_signInTimeoutMs = qMax(1, milliseconds); }

public Q_SLOTS:
    void cancelAction();
    void doneAction();
    // Publishes the media file with the form's values; ignored while publishing.
    void publishAction();

private:
    void startUpload(const QString &accessToken);
    void authorizeAndUpload();
    void finishPublishing(const zaf::OptionalError &error);
    // Drops a running browser sign-in: its flow, its loopback listener and its time limit.
    // A kept sign-in was refused: it is forgotten and the user signs in in the browser.
    void signInAfterARefusedRefresh();
    void abandonSignIn();
    // Runs on the main thread when the sign-in has not finished within signInTimeoutMs.
    void signInTimedOut();

    ZafPublishingAgentDelegate *m_delegate = nullptr;
    QString m_mediaPath;
    QString m_mediaURL;
    ZafYouTubeNavigationController *m_navigation;
    ZafYouTubePublishingForm *m_form;
    zaf::ui::BarButtonItem *m_publishItem = nullptr;
    QNetworkAccessManager *m_network;
    zaf::publishing::ResumableUpload *m_upload = nullptr;
    QOAuth2AuthorizationCodeFlow *m_oauth = nullptr;
    QString m_clientId;      // the client m_oauth signs in with
    bool m_refreshing = false; // m_oauth is refreshing a kept sign-in
    QTimer *m_signInTimer;
    int m_signInTimeoutMs = kDefaultSignInTimeoutMs;
    qint64 m_chunkSize = zaf::publishing::ResumableUpload::kDefaultChunkSize;
    void beginPublishing();
    bool m_publishing = false;
    // Publish was pressed and the delegate has not let it begin yet.
    bool m_awaitingDelegate = false;
};
