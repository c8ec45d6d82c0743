#pragma once

// ZafVideoEditorExtensionViewController: the extension's principal object. It loads the host's input
// items, builds the editor once the movie, the application's name and its identifier are known,
// embeds it, forwards its report to the host and tears it down when the host removes the view.
//
// Threads: main thread, except the item loads, which complete on worker threads and hand their
// values to the main thread (so the six slots are only ever touched there). Order: viewDidLoad
// starts the load; viewWillAppear builds an editor only when the required values are already in;
// once every load has ended, the editor is built (once) on the main thread; the report goes out from
// the thread the editor calls on; viewDidDisappear tears the editor down.

#include "editor/editor.h"
#include "extension/extension_protocols.h"
#include "platform/ui/view_controller.h"

#include <QColor>
#include <QPointer>
#include <QShortcut>
#include <QString>
#include <QUrl>

#include <functional>
#include <memory>

class ZafVideoEditorExtensionViewController : public zaf::ui::ViewController,
                                              public ZafVideoEditorViewControllerDelegate,
                                              public ZafVideoEditorExtensionProtocol {
    Q_OBJECT
    Q_INTERFACES(ZafVideoEditorViewControllerDelegate)
public:
    // bundle identifier, application name, movie URL (always present when called), then the file
    // attachment URL (empty when absent), the share message (null when absent), the tint colour
    // (invalid when absent).
    using InputItemsHandler = std::function<void(const QString &bundleIdentifier, const QString &appName,
                                                 const QUrl &movieURL, const QUrl &fileAttachmentURL,
                                                 const QString &overrideShareMessage, const QColor &overrideTintColor)>;

    explicit ZafVideoEditorExtensionViewController(QObject *parent = nullptr);
    ~ZafVideoEditorExtensionViewController() override;

    void viewDidLoad() override;
    // Cancel at the extension's level (closing the window, or Escape before there is an editor):
    // the editor's doneAction, or, when the host's items never made an editor, an empty report to
    // the host, once, so that the host can remove the view and the window goes.
    void cancel();
    void viewWillAppear(bool animated) override;
    void viewDidDisappear(bool animated) override;
    void viewDidLayoutSubviews() override;

    void setupChildViewControllers();
    void setupVideoEditorController();
    void tearDownChildViewControllers();
    // Loads the context's input items and calls the handler once, on the main thread, after every
    // load has ended, when the three required values are present; never when one is missing.
    void inputItemsFromClientWithCompletionHandler(InputItemsHandler handler);

    // The editor's report, forwarded to the host one-way. Any thread.
    void videoEditorDidFinishWithActivityTypes(ZafVideoEditorViewController *editor,
                                               const QStringList &activityTypes) override;

    ZafVideoEditorViewController *videoEditorViewController() const { return m_videoEditorViewController.get(); }
    QString bundleIdentifier() const { return m_bundleIdentifier; }
    void setBundleIdentifier(const QString &v) { m_bundleIdentifier = v; }
    QString appName() const { return m_appName; }
    void setAppName(const QString &v) { m_appName = v; }
    QUrl movieURL() const { return m_movieURL; }
    void setMovieURL(const QUrl &v) { m_movieURL = v; }
    QUrl fileAttachmentURL() const { return m_fileAttachmentURL; }
    void setFileAttachmentURL(const QUrl &v) { m_fileAttachmentURL = v; }
    QString overrideShareMessage() const { return m_overrideShareMessage; }
    void setOverrideShareMessage(const QString &v) { m_overrideShareMessage = v; }
    QColor overrideTintColor() const { return m_overrideTintColor; }
    void setOverrideTintColor(const QColor &v) { m_overrideTintColor = v; }

private:
    bool hasRequiredValues() const;

    std::unique_ptr<ZafVideoEditorViewController> m_videoEditorViewController;
    // Escape while there is no editor (the editor has its own while it is there).
    QPointer<QShortcut> m_escapeWithoutEditor;
    bool m_reportedWithoutEditor = false;
    QString m_bundleIdentifier;
    QString m_appName;
    QUrl m_movieURL;
    QUrl m_fileAttachmentURL;
    QString m_overrideShareMessage;
    QColor m_overrideTintColor;
};
