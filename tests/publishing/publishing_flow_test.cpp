// The YouTube action's publishing flow with the built plug-in: the prepared form, the overlay while
// the copy is exported and uploaded to the loopback server, the result alerts and the removal of
// the copy.
#include "identity/framework_strings.h"
#include "platform/media/export_session.h"
#include "platform/text/object_format.h"
#include "platform/ui/view_controller.h"
#include "publishing/youtube_activity.h"
#include "tests/publishing/upload_test_server.h"
#include "tests/support/wait_until.h"
#include "tests/support/media/fixture_movies.h"
#include "tests/support/process_temp_directory.h"
#include "tests/support/temp_dir.h"

#include <gtest/gtest.h>

#include <QAbstractButton>
#include <QEventLoop>
#include <QFile>
#include <QFileInfo>
#include <QMessageBox>
#include <QPushButton>
#include <QTimer>

#include <functional>
#include <memory>

namespace zaf::test {
namespace {

class FlowEnvironment : public ::testing::Environment {
public:
    void SetUp() override
    {
        usePrivateTempDirectoryForProcess();
        qputenv("ZAF_PUBLISHING_PLUGIN_PATH", ZAF_PUBLISHING_PLUGIN_PATH);
        qputenv("ZAF_PHOTO_LIBRARY_BUNDLE_PATH", ZAF_SHIPPED_PHOTO_LIBRARY_BUNDLE);
    }
};
const auto *const g_environment = ::testing::AddGlobalTestEnvironment(new FlowEnvironment);

// Sets the upload environment for one test and restores it afterwards.
class ScopedUploadEnvironment {
public:
    explicit ScopedUploadEnvironment(const QUrl &base)
    {
        qputenv("ZAF_YOUTUBE_API_BASE", base.toString().toUtf8());
        qputenv("ZAF_YOUTUBE_ACCESS_TOKEN", "test-token");
    }
    ~ScopedUploadEnvironment()
    {
        qunsetenv("ZAF_YOUTUBE_API_BASE");
        qunsetenv("ZAF_YOUTUBE_ACCESS_TOKEN");
    }
};

using zaf::test::waitUntil;

QString tableText(const char *key)
{
    const std::optional<QString> text = ZafLocalizedFrameworkString(QLatin1String(key));
    EXPECT_TRUE(text.has_value()) << key;
    EXPECT_NE(text.value_or(QString()), QLatin1String(key)) << "no table has " << key;
    return text.value_or(QString());
}

QObject *formOf(zaf::ui::ViewController *navigation)
{
    const QList<zaf::ui::ViewController *> children = navigation->childViewControllers();
    return children.isEmpty() ? nullptr : children.first();
}

QString invokeForString(QObject *target, const char *method)
{
    QString result;
    QMetaObject::invokeMethod(target, method, Q_RETURN_ARG(QString, result));
    return result;
}

QAbstractButton *publishButton(zaf::ui::ViewController *navigation)
{
    for (QPushButton *button : navigation->view()->findChildren<QPushButton *>()) {
        if (button->text() == QLatin1String("Publish"))
            return button;
    }
    return nullptr;
}

QStringList buttonTexts(QMessageBox *alert)
{
    QStringList texts;
    for (QAbstractButton *button : alert->buttons())
        texts << button->text();
    return texts;
}

QAbstractButton *buttonWithText(QMessageBox *alert, const QString &text)
{
    for (QAbstractButton *button : alert->buttons()) {
        if (button->text() == text)
            return button;
    }
    return nullptr;
}

// An activity prepared with the editor's usual items for a fresh fixture movie.
struct PreparedActivity {
    ScratchDir scratch;
    std::unique_ptr<ZafYouTubeActivity> activity = std::make_unique<ZafYouTubeActivity>();
    QList<bool> finishes;

    PreparedActivity()
    {
        fixture::FixtureSpec spec;
        spec.seconds = 4;
        spec.audioTracks = 2;
        const QString movie = makeFixtureMovie(scratch.path(), spec);
        EXPECT_FALSE(movie.isEmpty());
        QObject::connect(activity.get(), &zaf::ui::ShareActivity::activityFinished,
                         [this](bool completed) { finishes << completed; });
        activity->prepareWithActivityItems({QStringLiteral("Watch my run"), QStringLiteral("https://store.example/app"),
                                            QUrl::fromLocalFile(movie)});
    }

    bool waitForExport() const
    {
        const auto session = activity->exportSession();
        return session && waitUntil([&] {
                   const media::ExportStatus status = session->status();
                   return status == media::ExportStatus::Completed || status == media::ExportStatus::Failed
                       || status == media::ExportStatus::Cancelled;
               });
    }
    QString copyPath() const { return activity->movieURL().toLocalFile(); }
};

TEST(PublishingFlow, TheFormStartsWithTheDescriptionAndCategory20EveryTime)
{
    for (int round = 0; round < 2; ++round) {
        PreparedActivity prepared;
        zaf::ui::ViewController *navigation = prepared.activity->activityViewController();
        ASSERT_NE(navigation, nullptr);
        ASSERT_NE(prepared.activity->publishingAgent(), nullptr);
        EXPECT_EQ(prepared.activity->publishingAgent()->navigationController(), navigation);
        QObject *form = formOf(navigation);
        ASSERT_NE(form, nullptr);

        EXPECT_EQ(form->property("_defaultCategory").toString(), QStringLiteral("20")) << round;
        EXPECT_EQ(invokeForString(form, "categoryId"), QStringLiteral("20")) << round;
        QObject *categoryCell = nullptr;
        QMetaObject::invokeMethod(form, "_categoryCell", Q_RETURN_ARG(QObject *, categoryCell));
        ASSERT_NE(categoryCell, nullptr);
        QString label;
        for (const QVariant &entry : form->property("_categories").toList()) {
            if (entry.toMap().value(QStringLiteral("id")).toString() == QLatin1String("20"))
                label = entry.toMap().value(QStringLiteral("label")).toString();
        }
        EXPECT_FALSE(label.isEmpty());
        EXPECT_EQ(invokeForString(categoryCell, "categoryString"), label);
        EXPECT_EQ(invokeForString(form, "description"),
                  QStringLiteral("Watch my run https://store.example/app"));
        // The copies of one second share a name: leave none behind for the next activity.
        EXPECT_TRUE(prepared.waitForExport());
        QFile::remove(prepared.copyPath());
    }
}

TEST(PublishingFlow, DefaultCategoryRoutinePicksTheRowOfCategory20)
{
    PreparedActivity prepared;
    zaf::ui::ViewController *navigation = prepared.activity->activityViewController();
    ASSERT_NE(navigation, nullptr);
    QObject *form = formOf(navigation);
    ASSERT_NE(form, nullptr);
    // Three categories, only the second of which is Gaming.
    const QVariantList categories{
        QVariantMap{{QStringLiteral("id"), QStringLiteral("1")}, {QStringLiteral("label"), QStringLiteral("Film")}},
        QVariantMap{{QStringLiteral("id"), QStringLiteral("20")}, {QStringLiteral("label"), QStringLiteral("Gaming")}},
        QVariantMap{{QStringLiteral("id"), QStringLiteral("2")}, {QStringLiteral("label"), QStringLiteral("Autos")}}};
    form->setProperty("_categories", categories);
    ZafYouTubeActivity::selectDefaultCategoryOfForm(form);
    QObject *picker = form->property("_picker").value<QObject *>();
    ASSERT_NE(picker, nullptr);
    int row = -1;
    QMetaObject::invokeMethod(picker, "selectedRowInComponent", Q_RETURN_ARG(int, row), Q_ARG(int, 0));
    EXPECT_EQ(row, 1);
    EXPECT_EQ(form->property("_defaultCategory").toString(), QStringLiteral("20"));
    EXPECT_TRUE(prepared.waitForExport());
    QFile::remove(prepared.copyPath());
}

TEST(PublishingFlow, PublishingTheCopyEndsWithTheSuccessAlertAndRemovesTheCopy)
{
    UploadTestServer server(200, std::chrono::seconds(90));
    ASSERT_TRUE(server.listen());
    ScopedUploadEnvironment environment(server.baseUrl());

    PreparedActivity prepared;
    zaf::ui::ViewController *navigation = prepared.activity->activityViewController();
    ZafPublishingAgent *agent = prepared.activity->publishingAgent().get();
    ASSERT_NE(agent, nullptr);
    QByteArray uploadedCopy;
    QObject::connect(agent, &ZafPublishingAgent::uploadProgress, [&](qint64, qint64) {
        if (uploadedCopy.isEmpty()) {
            QFile copy(prepared.copyPath());
            if (copy.open(QIODevice::ReadOnly))
                uploadedCopy = copy.readAll();
        }
    });

    QAbstractButton *publish = publishButton(navigation);
    ASSERT_NE(publish, nullptr);
    const auto session = prepared.activity->exportSession();
    ASSERT_NE(session, nullptr);
    const media::ExportStatus statusAtPress = session->status();
    publish->click();
    if (statusAtPress == media::ExportStatus::Waiting || statusAtPress == media::ExportStatus::Exporting) {
        // Nothing is uploaded before the copy exists; the overlay covers the form meanwhile.
        EXPECT_TRUE(prepared.activity->isWaitingForExport() || session->status() == media::ExportStatus::Completed);
        ASSERT_NE(prepared.activity->progressOverlay(), nullptr);
    }

    ASSERT_TRUE(waitUntil([&] { return prepared.activity->resultAlert() != nullptr; }));
    EXPECT_EQ(session->status(), media::ExportStatus::Completed);
    ASSERT_NE(prepared.activity->progressOverlay(), nullptr);
    EXPECT_EQ(prepared.activity->progressOverlay()->parentWidget(), navigation->view());

    QMessageBox *alert = prepared.activity->resultAlert();
    EXPECT_EQ(alert->text(), tableText("PUBLISHED_VIDEO"));
    const QString viewTitle = text::formatWithObjects(tableText("VIEW_BUTTON_TITLE_FORMAT"), {QStringLiteral("YouTube")});
    EXPECT_TRUE(viewTitle.contains(QLatin1String("YouTube")));
    const QStringList texts = buttonTexts(alert);
    EXPECT_EQ(texts.size(), 2);
    EXPECT_TRUE(texts.contains(viewTitle)) << texts.join(QLatin1Char('|')).toStdString();
    EXPECT_TRUE(texts.contains(tableText("CLOSE")));

    const QString watchPrefix = QStringLiteral("https://www.youtube.com/watch?v=");
    ASSERT_TRUE(agent->mediaURL().startsWith(watchPrefix));
    ASSERT_FALSE(uploadedCopy.isEmpty());
    EXPECT_EQ(server.videoBytes(agent->mediaURL().mid(watchPrefix.size())), uploadedCopy);
    ASSERT_EQ(server.initiationBodies().size(), 1);
    EXPECT_TRUE(server.initiationBodies().first().contains("\"categoryId\":\"20\""));

    EXPECT_TRUE(waitUntil([&] { return !QFileInfo::exists(prepared.copyPath()); }));
    EXPECT_TRUE(prepared.finishes.isEmpty());
    QAbstractButton *close = buttonWithText(alert, tableText("CLOSE"));
    ASSERT_NE(close, nullptr);
    close->click();
    EXPECT_EQ(prepared.finishes, QList<bool>{true});
}

TEST(PublishingFlow, ARefusedUploadEndsWithTheFailureAlertAndNotCompleted)
{
    UploadTestServer server(50, std::chrono::seconds(90));
    ASSERT_TRUE(server.listen());
    server.setAcceptedCategories({QStringLiteral("22")}); // the pre-selected "20" gets a 400
    ScopedUploadEnvironment environment(server.baseUrl());

    PreparedActivity prepared;
    zaf::ui::ViewController *navigation = prepared.activity->activityViewController();
    ASSERT_TRUE(prepared.waitForExport());
    ASSERT_TRUE(QFileInfo::exists(prepared.copyPath()));
    QAbstractButton *publish = publishButton(navigation);
    ASSERT_NE(publish, nullptr);
    publish->click();

    ASSERT_TRUE(waitUntil([&] { return prepared.activity->resultAlert() != nullptr; }));
    QMessageBox *alert = prepared.activity->resultAlert();
    EXPECT_EQ(alert->text(), tableText("FAILED_PUBLISH_VIDEO"));
    EXPECT_EQ(buttonTexts(alert), QStringList{tableText("CLOSE")});
    EXPECT_EQ(server.count(QStringLiteral("PUT")), 0);
    EXPECT_TRUE(waitUntil([&] { return !QFileInfo::exists(prepared.copyPath()); }));

    alert->buttons().first()->click();
    EXPECT_EQ(prepared.finishes, QList<bool>{false});
}

TEST(PublishingFlow, CancelEndsNotCompletedAndRemovesTheCopy)
{
    PreparedActivity prepared;
    prepared.activity->activityViewController();
    ASSERT_TRUE(prepared.waitForExport());
    ASSERT_TRUE(QFileInfo::exists(prepared.copyPath()));

    ASSERT_TRUE(QMetaObject::invokeMethod(prepared.activity->publishingAgent().get(), "cancelAction"));
    EXPECT_EQ(prepared.finishes, QList<bool>{false});
    EXPECT_TRUE(waitUntil([&] { return !QFileInfo::exists(prepared.copyPath()); }));
    EXPECT_EQ(prepared.activity->resultAlert(), nullptr);
}

} // namespace
} // namespace zaf::test
