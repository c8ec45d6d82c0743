// The publishing plug-in as the editor uses it: loaded from its file, its agent class found by name,
// the form's interior reached by name, and an agent publishing to the loopback upload server.

#include "publishing/plugin_loader.h"
#include "publishing/publishing_agent.h"
#include "platform/ui/view_controller.h"
#include "tests/publishing/upload_test_server.h"
#include "tests/support/wait_until.h"
#include "tests/publishing/upload_test_support.h"
#include "tests/support/temp_dir.h"

#include <gtest/gtest.h>

#include <QEventLoop>
#include <QFile>
#include <QTimer>
#include <QVariantMap>
#include <QWidget>

#include <memory>

namespace {

const QString kPluginPath = QStringLiteral(ZAF_PUBLISHING_PLUGIN_PATH);

std::unique_ptr<ZafPublishingAgent> makeAgent()
{
    const auto agentClass = zaf::publishing::publishingAgentClass(kPluginPath, QLatin1String(kZafYouTubePublishingAgentClassName));
    if (!agentClass.ok())
        return nullptr;
    return std::unique_ptr<ZafPublishingAgent>(qobject_cast<ZafPublishingAgent *>(agentClass.value->newInstance()));
}

QObject *formOf(ZafPublishingAgent *agent)
{
    const QList<zaf::ui::ViewController *> children = agent->navigationController()->childViewControllers();
    return children.isEmpty() ? nullptr : children.first();
}

QObject *invokeForObject(QObject *target, const char *method)
{
    QObject *result = nullptr;
    if (!QMetaObject::invokeMethod(target, method, Q_RETURN_ARG(QObject *, result)))
        return nullptr;
    return result;
}

QString invokeForString(QObject *target, const char *method)
{
    QString result;
    QMetaObject::invokeMethod(target, method, Q_RETURN_ARG(QString, result));
    return result;
}

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
        ended = true;
    }

    QStringList events;
    std::optional<zaf::Error> error;
    bool ended = false;
};

// Sets the upload environment for one test and restores it afterwards.
class ScopedEnvironment {
public:
    ScopedEnvironment(const QUrl &base, const QByteArray &token)
    {
        qputenv("ZAF_YOUTUBE_API_BASE", base.toString().toUtf8());
        qputenv("ZAF_YOUTUBE_ACCESS_TOKEN", token);
    }
    ~ScopedEnvironment()
    {
        qunsetenv("ZAF_YOUTUBE_API_BASE");
        qunsetenv("ZAF_YOUTUBE_ACCESS_TOKEN");
    }
};

using zaf::test::waitUntil;

TEST(PublishingPluginTest, LoadsThePluginAndFindsTheAgentClassByName)
{
    const auto plugin = zaf::publishing::loadPublishingPlugin(kPluginPath);
    ASSERT_TRUE(plugin.ok()) << plugin.errorText.toStdString();
    EXPECT_EQ(plugin.value->apiVersion(), kZafPublishingPluginApiVersion);
    EXPECT_TRUE(kPluginPath.endsWith(QLatin1String(kZafPublishingPluginFileName)));

    const auto agentClass = zaf::publishing::publishingAgentClass(kPluginPath, QStringLiteral("ZafYouTubePublishingAgent"));
    ASSERT_TRUE(agentClass.ok()) << agentClass.errorText.toStdString();
    EXPECT_STREQ(agentClass.value->className(), "ZafYouTubePublishingAgent");
    // Cached: the same meta-object again.
    EXPECT_EQ(zaf::publishing::publishingAgentClass(kPluginPath, QStringLiteral("ZafYouTubePublishingAgent")).value,
              agentClass.value);

    std::unique_ptr<QObject> agent(agentClass.value->newInstance());
    ASSERT_NE(agent, nullptr);
    EXPECT_NE(qobject_cast<ZafPublishingAgent *>(agent.get()), nullptr);
}

TEST(PublishingPluginTest, AWrongClassNameGivesNull)
{
    const auto plugin = zaf::publishing::loadPublishingPlugin(kPluginPath);
    ASSERT_TRUE(plugin.ok());
    EXPECT_EQ(plugin.value->agentClassNamed(QStringLiteral("ZafVimeoPublishingAgent")), nullptr);
    const auto missing = zaf::publishing::publishingAgentClass(kPluginPath, QStringLiteral("NoSuchAgent"));
    EXPECT_FALSE(missing.ok());
    EXPECT_TRUE(missing.errorText.contains(QLatin1String("NoSuchAgent")));
}

TEST(PublishingPluginTest, AFileThatIsNoPluginIsRefusedWithAReason)
{
    zaf::test::ScratchDir scratch;
    const QString path = scratch.file(QStringLiteral("libnot_a_plugin.so"));
    QFile file(path);
    ASSERT_TRUE(file.open(QIODevice::WriteOnly));
    file.write("not a shared library");
    file.close();
    const auto plugin = zaf::publishing::loadPublishingPlugin(path);
    EXPECT_FALSE(plugin.ok());
    EXPECT_FALSE(plugin.errorText.isEmpty());
    const auto absent = zaf::publishing::publishingAgentClass(scratch.file(QStringLiteral("absent.so")),
                                                               QStringLiteral("ZafYouTubePublishingAgent"));
    EXPECT_FALSE(absent.ok());
    EXPECT_FALSE(absent.errorText.isEmpty());
}

TEST(PublishingPluginTest, TheFormsNamedInteriorIsReachable)
{
    auto agent = makeAgent();
    ASSERT_NE(agent, nullptr);
    QObject *form = formOf(agent.get());
    ASSERT_NE(form, nullptr);
    static_cast<zaf::ui::ViewController *>(form)->view();

    auto *table = form->property("_table").value<QObject *>();
    ASSERT_NE(table, nullptr);
    EXPECT_EQ(table->objectName(), QStringLiteral("_table"));
    QObject *descriptionCell = nullptr;
    ASSERT_TRUE(QMetaObject::invokeMethod(table, "cellForRowInSection", Q_RETURN_ARG(QObject *, descriptionCell),
                                          Q_ARG(int, 1), Q_ARG(int, 0)));
    ASSERT_NE(descriptionCell, nullptr);
    EXPECT_TRUE(QMetaObject::invokeMethod(descriptionCell, "setValue", Q_ARG(QString, QStringLiteral("My run"))));
    EXPECT_TRUE(QMetaObject::invokeMethod(descriptionCell, "setPlaceholderText", Q_ARG(QString, QString())));
    EXPECT_EQ(invokeForString(form, "description"), QStringLiteral("My run"));
    QObject *outside = reinterpret_cast<QObject *>(1);
    ASSERT_TRUE(QMetaObject::invokeMethod(table, "cellForRowInSection", Q_RETURN_ARG(QObject *, outside),
                                          Q_ARG(int, 1), Q_ARG(int, 3)));
    EXPECT_EQ(outside, nullptr);

    const QVariantList categories = form->property("_categories").toList();
    ASSERT_EQ(categories.size(), 15);
    EXPECT_EQ(categories.first().toMap().value(QStringLiteral("id")).toString(), QStringLiteral("1"));
    QStringList ids;
    for (const QVariant &entry : categories) {
        ids << entry.toMap().value(QLatin1String(kZafPublishingCategoryIdKey)).toString();
        EXPECT_FALSE(entry.toMap().value(QLatin1String(kZafPublishingCategoryLabelKey)).toString().isEmpty());
    }
    EXPECT_TRUE(ids.contains(QStringLiteral("20")));

    EXPECT_EQ(form->property("_defaultCategory").toString(), QStringLiteral("22"));
    // The built-in routine picked the default category when the view loaded.
    EXPECT_EQ(invokeForString(form, "categoryId"), QStringLiteral("22"));
    QObject *categoryCell = invokeForObject(form, "_categoryCell");
    ASSERT_NE(categoryCell, nullptr);
    EXPECT_EQ(invokeForString(categoryCell, "categoryString"),
              categories.at(ids.indexOf(QStringLiteral("22"))).toMap().value(QStringLiteral("label")).toString());

    auto *picker = form->property("_picker").value<QObject *>();
    ASSERT_NE(picker, nullptr);
    EXPECT_EQ(picker->objectName(), QStringLiteral("_picker"));
    EXPECT_TRUE(QMetaObject::invokeMethod(picker, "selectRowInComponentAnimated", Q_ARG(int, 0), Q_ARG(int, 0),
                                          Q_ARG(bool, false)));
    EXPECT_EQ(invokeForString(form, "categoryId"), QStringLiteral("1"));
}

TEST(PublishingPluginTest, AReplacedDefaultCategoryRoutineRunsForEveryLaterForm)
{
    const auto plugin = zaf::publishing::loadPublishingPlugin(kPluginPath);
    ASSERT_TRUE(plugin.ok());
    int calls = 0;
    plugin.value->setFormDefaultCategoryRoutine([&calls](QObject *form) {
        ++calls;
        const QVariantList categories = form->property("_categories").toList();
        auto *picker = form->property("_picker").value<QObject *>();
        for (int i = 0; i < categories.size(); ++i) {
            const QVariantMap entry = categories.at(i).toMap();
            if (entry.value(QStringLiteral("id")).toString().toLower() != QLatin1String("20"))
                continue;
            QObject *cell = invokeForObject(form, "_categoryCell");
            QMetaObject::invokeMethod(cell, "setCategoryString", Q_ARG(QString, entry.value(QStringLiteral("label")).toString()));
            form->setProperty("_defaultCategory", entry.value(QStringLiteral("id")));
            QMetaObject::invokeMethod(picker, "selectRowInComponentAnimated", Q_ARG(int, i), Q_ARG(int, 0), Q_ARG(bool, false));
            return;
        }
    });

    for (int round = 0; round < 2; ++round) {
        auto agent = makeAgent();
        ASSERT_NE(agent, nullptr);
        QObject *form = formOf(agent.get());
        static_cast<zaf::ui::ViewController *>(form)->view();
        EXPECT_EQ(form->property("_defaultCategory").toString(), QStringLiteral("20"));
        EXPECT_EQ(invokeForString(form, "categoryId"), QStringLiteral("20"));
        EXPECT_EQ(invokeForString(invokeForObject(form, "_categoryCell"), "categoryString"), QStringLiteral("Gaming"));
    }
    EXPECT_EQ(calls, 2);

    plugin.value->setFormDefaultCategoryRoutine({});
    auto agent = makeAgent();
    QObject *form = formOf(agent.get());
    static_cast<zaf::ui::ViewController *>(form)->view();
    EXPECT_EQ(invokeForString(form, "categoryId"), QStringLiteral("22"));
    EXPECT_EQ(calls, 2);
}

TEST(PublishingPluginTest, CancelAndDoneCallTheDelegate)
{
    auto agent = makeAgent();
    ASSERT_NE(agent, nullptr);
    RecordingDelegate delegate;
    agent->setDelegate(&delegate);
    agent->navigationController()->beginAppearanceTransition(true, false);
    agent->navigationController()->endAppearanceTransition();
    ASSERT_TRUE(QMetaObject::invokeMethod(agent.get(), "doneAction"));
    ASSERT_TRUE(QMetaObject::invokeMethod(agent.get(), "cancelAction"));
    EXPECT_EQ(delegate.events, (QStringList{QStringLiteral("displayed"), QStringLiteral("done"), QStringLiteral("cancel")}));
}

TEST(PublishingPluginTest, PublishesToTheLoopbackServerAndEndsWithTheWatchUrl)
{
    zaf::test::ScratchDir scratch;
    const QByteArray movie = zaf::test::variedBytes(300 * 1024);
    const QString path = scratch.file(QStringLiteral("movie.mp4"));
    QFile file(path);
    ASSERT_TRUE(file.open(QIODevice::WriteOnly));
    file.write(movie);
    file.close();

    zaf::test::UploadTestServer server(40, std::chrono::seconds(20));
    ASSERT_TRUE(server.listen());
    ScopedEnvironment environment(server.baseUrl(), "test-token");

    auto agent = makeAgent();
    ASSERT_NE(agent, nullptr);
    RecordingDelegate delegate;
    agent->setDelegate(&delegate);
    agent->setMediaPath(path);
    QObject *form = formOf(agent.get());
    static_cast<zaf::ui::ViewController *>(form)->view();
    QMetaObject::invokeMethod(form, "setTitle", Q_ARG(QString, QStringLiteral("Speedrun <final>")));
    QMetaObject::invokeMethod(form, "setPrivacyStatus", Q_ARG(QString, QStringLiteral("Unlisted")));
    qint64 lastSent = -1;
    qint64 lastTotal = -1;
    QObject::connect(agent.get(), &ZafPublishingAgent::uploadProgress, [&](qint64 sent, qint64 total) {
        lastSent = sent;
        lastTotal = total;
    });

    ASSERT_TRUE(QMetaObject::invokeMethod(agent.get(), "publishAction"));
    ASSERT_TRUE(waitUntil([&] { return delegate.ended; }));

    EXPECT_EQ(delegate.events, (QStringList{QStringLiteral("begin"), QStringLiteral("end")}));
    EXPECT_FALSE(delegate.error.has_value()) << (delegate.error ? delegate.error->description().toStdString() : "");
    ASSERT_TRUE(agent->mediaURL().startsWith(QLatin1String("https://www.youtube.com/watch?v=")));
    const QString videoId = agent->mediaURL().mid(QStringLiteral("https://www.youtube.com/watch?v=").size());
    EXPECT_EQ(server.videoBytes(videoId), movie);
    EXPECT_EQ(lastSent, movie.size());
    EXPECT_EQ(lastTotal, movie.size());

    ASSERT_EQ(server.initiationBodies().size(), 1);
    const QByteArray body = server.initiationBodies().first();
    EXPECT_TRUE(body.contains("\"categoryId\":\"22\"")) << body.toStdString();
    EXPECT_TRUE(body.contains("\"privacyStatus\":\"unlisted\"")) << body.toStdString();
    EXPECT_TRUE(body.contains("Speedrun final")) << body.toStdString();
}

TEST(PublishingPluginTest, ARefusedInitiationEndsWithAnError)
{
    zaf::test::ScratchDir scratch;
    const QString path = scratch.file(QStringLiteral("movie.mp4"));
    QFile file(path);
    ASSERT_TRUE(file.open(QIODevice::WriteOnly));
    file.write(zaf::test::variedBytes(4096));
    file.close();

    zaf::test::UploadTestServer server(20, std::chrono::seconds(20));
    ASSERT_TRUE(server.listen());
    server.setAcceptedCategories({QStringLiteral("20")}); // the form's "22" gets a 400
    ScopedEnvironment environment(server.baseUrl(), "test-token");

    auto agent = makeAgent();
    ASSERT_NE(agent, nullptr);
    RecordingDelegate delegate;
    agent->setDelegate(&delegate);
    agent->setMediaPath(path);

    ASSERT_TRUE(QMetaObject::invokeMethod(agent.get(), "publishAction"));
    ASSERT_TRUE(waitUntil([&] { return delegate.ended; }));
    EXPECT_EQ(delegate.events, (QStringList{QStringLiteral("begin"), QStringLiteral("end")}));
    ASSERT_TRUE(delegate.error.has_value());
    EXPECT_EQ(delegate.error->code, 400);
    EXPECT_TRUE(agent->mediaURL().isEmpty());
    EXPECT_EQ(server.count(QStringLiteral("PUT")), 0);
}

TEST(PublishingPluginTest, WithoutTokenOrClientIdPublishingEndsAtOnceWithAnError)
{
    qunsetenv("ZAF_YOUTUBE_ACCESS_TOKEN");
    qunsetenv("ZAF_YOUTUBE_CLIENT_ID");
    qputenv("ZAF_YOUTUBE_API_BASE", "http://127.0.0.1:9");
    auto agent = makeAgent();
    ASSERT_NE(agent, nullptr);
    RecordingDelegate delegate;
    agent->setDelegate(&delegate);
    agent->setMediaPath(QStringLiteral("/nonexistent/movie.mp4"));
    ASSERT_TRUE(QMetaObject::invokeMethod(agent.get(), "publishAction"));
    qunsetenv("ZAF_YOUTUBE_API_BASE");
    EXPECT_TRUE(delegate.ended);
    EXPECT_EQ(delegate.events, (QStringList{QStringLiteral("begin"), QStringLiteral("end")}));
    ASSERT_TRUE(delegate.error.has_value());
    EXPECT_TRUE(delegate.error->message.contains(QLatin1String("ZAF_YOUTUBE_CLIENT_ID")));
}

} // namespace
