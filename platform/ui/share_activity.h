#pragma once

// ShareActivity: one thing the share sheet can do with the items being shared (send them by mail,
// copy them, save the movie somewhere, or an action of the application's own).
//
// Activity items are QVariants: QString texts and QUrl file URLs (other values are ignored by the
// platform activities). The share sheet asks canPerformWithActivityItems() to decide whether the
// activity is listed; once the user chooses it the sheet calls prepareWithActivityItems(), then
// presents activityViewController() from the controller that presented the sheet, or, when that is
// null, calls performActivity(). Either way the activity ends by calling activityDidFinish() exactly
// once, optionally with an error attached first (setActivityError).
//
// Threads: main thread only. An activity that works elsewhere moves back to the main thread before
// it calls activityDidFinish().

#include "platform/error.h"

#include <QIcon>
#include <QList>
#include <QLoggingCategory>
#include <QObject>
#include <QPointer>
#include <QString>
#include <QStringList>
#include <QUrl>
#include <QVariantList>

#include <optional>

class QWidget;

namespace zaf::ui {

class ViewController;

// The log category of the share sheet and its activities.
Q_DECLARE_LOGGING_CATEGORY(lcShare)

// The activity types of the platform. Message and PostToSocial have no performer on this desktop;
// they exist so that order and exclusion lists can name them.
inline constexpr const char *kActivityTypeMail = "com.zafrel.activity.Mail";
inline constexpr const char *kActivityTypeMessage = "com.zafrel.activity.Message";
inline constexpr const char *kActivityTypeCopyToPasteboard = "com.zafrel.activity.CopyToPasteboard";
inline constexpr const char *kActivityTypePostToSocial = "com.zafrel.activity.PostToSocial";
inline constexpr const char *kActivityTypeSaveToPhotoLibrary = "com.zafrel.activity.SaveToPhotoLibrary";
inline constexpr const char *kActivityTypeOpenWith = "com.zafrel.activity.OpenWith";
inline constexpr const char *kActivityTypeSaveToFolder = "com.zafrel.activity.SaveToFolder";

// Errors the platform activities report (domain kShareErrorDomain).
inline constexpr const char *kShareErrorDomain = "zaf.share";
enum ShareErrorCode : int {
    kShareErrorNoItems = 1,          // nothing the activity can use among the items
    kShareErrorProgramFailed = 2,    // the helper program could not start or exited with an error
    kShareErrorCopyFailed = 3,       // a file could not be copied
    kShareErrorFolderUnavailable = 4, // a destination folder could not be made
};

class ShareActivity : public QObject {
    Q_OBJECT
public:
    explicit ShareActivity(QObject *parent = nullptr);
    ~ShareActivity() override;

    // Identity shown by the sheet and reported in its completion.
    virtual QString activityType() const = 0;
    virtual QString activityTitle() const = 0;
    virtual QIcon activityImage() const;

    // Whether the activity can do something with these items (default: no).
    virtual bool canPerformWithActivityItems(const QVariantList &activityItems);
    // Called once the user has chosen the activity, before activityViewController/performActivity.
    // The default keeps the items (activityItems()).
    virtual void prepareWithActivityItems(const QVariantList &activityItems);
    // A controller the sheet presents for the activity, or null (default) to call performActivity().
    virtual ViewController *activityViewController();
    // Does the work of an activity without a view controller. The default finishes, not completed.
    virtual void performActivity();

    // Ends the activity; the first call after preparation counts, later ones are ignored.
    void activityDidFinish(bool completed);
    bool isFinished() const { return m_finished; }

    // The error reported with the finish (none by default; cleared by each preparation).
    void setActivityError(const OptionalError &error) { m_error = error; }
    OptionalError activityError() const { return m_error; }

    // The items given to the last preparation.
    QVariantList activityItems() const { return m_items; }
    // A widget to parent the activity's own dialogs to (the presenting window); may be null.
    void setPresentationWidget(QWidget *widget);
    QWidget *presentationWidget() const;

    // Helpers over activity items: the local file URLs, and the non-empty texts, in item order.
    static QList<QUrl> fileURLsInItems(const QVariantList &activityItems);
    static QStringList textsInItems(const QVariantList &activityItems);

Q_SIGNALS:
    // Emitted by activityDidFinish (main thread).
    void activityFinished(bool completed);

private:
    friend class ShareSheet;
    // Starts a new run: clears the finished flag and the error.
    void beginRun();

    QVariantList m_items;
    OptionalError m_error;
    QPointer<QWidget> m_presentationWidget;
    bool m_finished = false;
};

} // namespace zaf::ui
