// The publishing plug-in as the editor uses it: loaded from its file, its agent class found by name,
// the form's interior reached by name and the agent's delegate calls. Uploads: see the flow tests.
#include "publishing/form_reflection.h"
#include "publishing/plugin_loader.h"
#include "publishing/youtube_activity.h"
#include "tests/publishing/agent_test_support.h"
#include "tests/support/log_capture.h"
#include "tests/support/named_cases.h"
#include "tests/support/temp_dir.h"
#include "tests/support/wait_until.h"

#include <gtest/gtest.h>

#include <QFile>
#include <QVariantMap>

#include <memory>

namespace {

ZAF_PRINT_CASES_AS_NAMES
using zaf::test::formOf;
using zaf::test::invokeForObject;
using zaf::test::invokeForString;
using zaf::test::makeAgent;
using zaf::test::RecordingDelegate;

const QString kPluginPath = QStringLiteral(ZAF_PUBLISHING_PLUGIN_PATH);

class PublishingAgentTest : public ::testing::Test {
protected:
    void SetUp() override
    {
        // No client the user set up on this machine, and none kept, leaks in.
        qputenv("XDG_CONFIG_HOME", QFile::encodeName(m_config.path()));
        m_agent = makeAgent();
        ASSERT_NE(m_agent, nullptr);
        m_agent->setDelegate(&m_delegate);
    }

    zaf::test::ScratchDir m_config;
    std::unique_ptr<ZafPublishingAgent> m_agent;
    RecordingDelegate m_delegate;
};

// Once: a later look-up gives the same class, which makes agents.
TEST(PublishingPluginTest, FindsTheAgentClassByName)
{
    const auto agentClass = zaf::publishing::publishingAgentClass(kPluginPath, QLatin1String(kZafYouTubePublishingAgentClassName));
    ASSERT_TRUE(agentClass.ok()) << agentClass.errorText.toStdString();
    EXPECT_STREQ(agentClass.value->className(), kZafYouTubePublishingAgentClassName);
    EXPECT_EQ(zaf::publishing::publishingAgentClass(kPluginPath, QLatin1String(kZafYouTubePublishingAgentClassName)).value,
              agentClass.value);
    std::unique_ptr<QObject> agent(agentClass.value->newInstance());
    EXPECT_NE(qobject_cast<ZafPublishingAgent *>(agent.get()), nullptr);
}

class RefusedLookupTest : public ::testing::TestWithParam<const char *> {};

// The reason names the class or the file.
TEST_P(RefusedLookupTest, IsRefusedWithAReason)
{
    zaf::test::ScratchDir scratch;
    const QString which = QString::fromLatin1(GetParam());
    const bool wrongClass = which == QLatin1String("WrongClassName");
    const QString path = wrongClass ? kPluginPath
                         : which == QLatin1String("NotAPlugin") ? scratch.write(QStringLiteral("libnot_a_plugin.so"), 64)
                                                                 : scratch.file(QStringLiteral("absent.so"));
    const QString className = wrongClass ? QStringLiteral("NoSuchAgent") : QLatin1String(kZafYouTubePublishingAgentClassName);
    const auto lookup = zaf::publishing::publishingAgentClass(path, className);
    EXPECT_FALSE(lookup.ok());
    EXPECT_TRUE(lookup.errorText.contains(wrongClass ? className : path)) << lookup.errorText.toStdString();
}

INSTANTIATE_TEST_SUITE_P(Lookups, RefusedLookupTest, ::testing::Values("WrongClassName", "NotAPlugin", "MissingFile"),
                         [](const auto &info) { return std::string(info.param); });

// The description cell is reached by name through the form's table, as the share action reaches it;
// a section the table lacks has no cell.
TEST_F(PublishingAgentTest, TheDescriptionCellIsReachedByName)
{
    QObject *form = formOf(m_agent.get());
    zaf::test::LogCapture log;
    zaf::publishing::fillDescriptionOfForm(form, QStringLiteral("My run"));
    EXPECT_EQ(invokeForString(form, "description"), QStringLiteral("My run"));
    EXPECT_TRUE(log.messages(QStringLiteral("zaf.publishing.activity")).isEmpty());
    QObject *cell = form;
    EXPECT_TRUE(QMetaObject::invokeMethod(zaf::publishing::objectProperty(form, kZafFormTableProperty), kZafTableCellMethod,
                                          Q_RETURN_ARG(QObject *, cell), Q_ARG(int, 1), Q_ARG(int, 3)));
    EXPECT_EQ(cell, nullptr);
}

// The form lists the assignable categories, "20" among them, and its own routine pre-selects "22".
TEST_F(PublishingAgentTest, TheFormsOwnRoutinePreselects22)
{
    QObject *form = formOf(m_agent.get());
    ASSERT_NE(form, nullptr);
    QStringList ids;
    for (const QVariant &entry : form->property(kZafFormCategoriesProperty).toList()) {
        ids << entry.toMap().value(QLatin1String(kZafPublishingCategoryIdKey)).toString();
        EXPECT_FALSE(entry.toMap().value(QLatin1String(kZafPublishingCategoryLabelKey)).toString().isEmpty());
    }
    EXPECT_EQ(ids.size(), 15);
    EXPECT_TRUE(ids.contains(QStringLiteral("20")));
    EXPECT_EQ(form->property(kZafFormDefaultCategoryProperty).toString(), QStringLiteral("22"));
    EXPECT_EQ(invokeForString(form, "categoryId"), QStringLiteral("22"));
    EXPECT_EQ(invokeForString(invokeForObject(form, kZafFormCategoryCellMethod), "categoryString"), QStringLiteral("People & Blogs"));
}

TEST(PublishingPluginTest, AReplacedDefaultCategoryRoutineRunsForEveryLaterForm)
{
    const auto plugin = zaf::publishing::loadPublishingPlugin(kPluginPath);
    ASSERT_TRUE(plugin.ok());
    int calls = 0;
    plugin.value->setFormDefaultCategoryRoutine([&calls](QObject *form) {
        ++calls;
        ZafYouTubeActivity::selectDefaultCategoryOfForm(form);
    });
    for (int round = 0; round < 2; ++round) {
        auto agent = makeAgent();
        ASSERT_NE(agent, nullptr);
        QObject *form = formOf(agent.get());
        EXPECT_EQ(form->property(kZafFormDefaultCategoryProperty).toString(), QStringLiteral("20"));
        EXPECT_EQ(invokeForString(form, "categoryId"), QStringLiteral("20"));
        EXPECT_EQ(invokeForString(invokeForObject(form, kZafFormCategoryCellMethod), "categoryString"), QStringLiteral("Gaming"));
    }
    EXPECT_EQ(calls, 2);
    plugin.value->setFormDefaultCategoryRoutine({});
}

TEST(PublishingPluginTest, AnEmptyRoutineRestoresTheFormsOwn)
{
    const auto plugin = zaf::publishing::loadPublishingPlugin(kPluginPath);
    ASSERT_TRUE(plugin.ok());
    int calls = 0;
    plugin.value->setFormDefaultCategoryRoutine([&calls](QObject *) { ++calls; });
    plugin.value->setFormDefaultCategoryRoutine({});
    auto agent = makeAgent();
    ASSERT_NE(agent, nullptr);
    EXPECT_EQ(invokeForString(formOf(agent.get()), "categoryId"), QStringLiteral("22"));
    EXPECT_EQ(calls, 0);
}

struct MissingMemberCase {
    const char *name;
    std::function<void(QObject *form)> reach;
    QStringList logged;
    const char *defaultCategory; // what the form's default category is afterwards
};

class MissingMemberTest : public ::testing::TestWithParam<MissingMemberCase> {};

// A form that lacks what the activity reaches by name (a missing property, a method it does not
// answer) is told in the log, and what can still be done is done.
TEST_P(MissingMemberTest, IsLoggedNotSilent)
{
    QObject form;
    form.setProperty(kZafFormCategoriesProperty, QVariantList{QVariantMap{{kZafPublishingCategoryIdKey, QStringLiteral("20")},
                                                                          {kZafPublishingCategoryLabelKey, QStringLiteral("Gaming")}}});
    zaf::test::LogCapture log;
    GetParam().reach(&form);
    EXPECT_EQ(form.property(kZafFormDefaultCategoryProperty).toString(), QString::fromLatin1(GetParam().defaultCategory));
    EXPECT_EQ(log.messages(QStringLiteral("zaf.publishing.activity")), GetParam().logged);
}

INSTANTIATE_TEST_SUITE_P(Reaches, MissingMemberTest, ::testing::Values(
    MissingMemberCase{"DefaultCategory", &ZafYouTubeActivity::selectDefaultCategoryOfForm,
                      {"the publishing form has no _picker", "the publishing form does not answer _categoryCell on QObject"}, "20"},
    MissingMemberCase{"Description", [](QObject *form) { zaf::publishing::fillDescriptionOfForm(form, QStringLiteral("d")); },
                      {"the publishing form has no _table"}, ""},
    MissingMemberCase{"AgentCancel", [](QObject *form) { zaf::publishing::invokeByName(form, kZafAgentCancelMethod); },
                      {"the publishing form does not answer cancelAction on QObject"}, ""}),
    zaf::test::caseName);

TEST_F(PublishingAgentTest, TheFormsEventsReachTheDelegate)
{
    m_agent->navigationController()->beginAppearanceTransition(true, false);
    m_agent->navigationController()->endAppearanceTransition();
    ASSERT_TRUE(QMetaObject::invokeMethod(m_agent.get(), "doneAction"));
    ASSERT_TRUE(QMetaObject::invokeMethod(m_agent.get(), kZafAgentCancelMethod));
    EXPECT_EQ(m_delegate.events, (QStringList{QStringLiteral("displayed"), QStringLiteral("done"), QStringLiteral("cancel")}));
}

// Naming the setting.
TEST_F(PublishingAgentTest, WithoutCredentialsPublishingEndsAtOnceWithAnError)
{
    qunsetenv("ZAF_YOUTUBE_ACCESS_TOKEN");
    qunsetenv("ZAF_YOUTUBE_CLIENT_ID");
    qputenv("ZAF_YOUTUBE_API_BASE", "http://127.0.0.1:9");
    m_agent->setMediaPath(QStringLiteral("/nonexistent/movie.mp4"));
    ASSERT_TRUE(QMetaObject::invokeMethod(m_agent.get(), "publishAction"));
    qunsetenv("ZAF_YOUTUBE_API_BASE");
    EXPECT_EQ(m_delegate.events, (QStringList{QStringLiteral("begin"), QStringLiteral("end")}));
    ASSERT_TRUE(m_delegate.error.has_value());
    EXPECT_TRUE(m_delegate.error->message.contains(QLatin1String("zaf-youtube-setup"))) << m_delegate.error->message.toStdString();
}

// Cancel during the browser sign-in ends it quietly: no end of publishing, even after the time
// limit, and its loopback listener closed; a new Publish signs in afresh.
TEST_F(PublishingAgentTest, CancelEndsASignInQuietly)
{
    zaf::test::SignInEnvironment signIn;
    m_agent->setMediaPath(QStringLiteral("/nonexistent/movie.mp4"));
    ASSERT_TRUE(m_agent->setProperty("signInTimeoutMs", 100));
    ASSERT_TRUE(QMetaObject::invokeMethod(m_agent.get(), "publishAction"));
    // The browser opens once the secret store has said it keeps no sign-in.
    ASSERT_TRUE(zaf::test::waitUntil([&] { return signIn.browser.opened.size() == 1; }, 10000));
    EXPECT_EQ(signIn.browser.opened.first().host(), QStringLiteral("accounts.google.com"));
    const quint16 port = signIn.browser.redirectPort();
    ASSERT_NE(port, 0);
    ASSERT_TRUE(QMetaObject::invokeMethod(m_agent.get(), kZafAgentCancelMethod));
    EXPECT_FALSE(zaf::test::acceptsConnections(port));
    zaf::test::waitUntil([] { return false; }, 300);
    EXPECT_EQ(m_delegate.events, (QStringList{QStringLiteral("begin"), QStringLiteral("cancel")}));
    ASSERT_TRUE(QMetaObject::invokeMethod(m_agent.get(), "publishAction"));
    EXPECT_TRUE(zaf::test::waitUntil([&] { return signIn.browser.opened.size() == 2; }, 10000));
}

// A sign-in abandoned in the browser ends publishing with an error after the agent's limit, and
// closes its listener.
TEST_F(PublishingAgentTest, AnAbandonedSignInEndsAfterItsLimit)
{
    zaf::test::SignInEnvironment signIn;
    m_agent->setMediaPath(QStringLiteral("/nonexistent/movie.mp4"));
    ASSERT_TRUE(m_agent->setProperty("signInTimeoutMs", 100));
    ASSERT_TRUE(QMetaObject::invokeMethod(m_agent.get(), "publishAction"));
    ASSERT_TRUE(zaf::test::waitUntil([&] { return signIn.browser.opened.size() == 1; }, 10000));
    const quint16 port = signIn.browser.redirectPort();
    ASSERT_TRUE(zaf::test::waitUntil([this] { return m_delegate.events.size() == 2; }, 5000));
    EXPECT_EQ(m_delegate.events, (QStringList{QStringLiteral("begin"), QStringLiteral("end")}));
    ASSERT_TRUE(m_delegate.error.has_value());
    EXPECT_TRUE(m_delegate.error->message.contains(QLatin1String("sign-in"))) << m_delegate.error->message.toStdString();
    EXPECT_FALSE(zaf::test::acceptsConnections(port));
}

} // namespace
