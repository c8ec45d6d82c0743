// The publishing plug-in as the editor uses it: loaded from its file, its agent class found by name,
// the form's interior reached by name and the agent's delegate calls. Uploads: see the flow tests.
#include "platform/ui/view_controller.h"
#include "publishing/plugin_loader.h"
#include "publishing/publishing_agent.h"
#include "publishing/youtube_activity.h"
#include "tests/publishing/sign_in_support.h"
#include "tests/support/log_capture.h"
#include "tests/support/temp_dir.h"
#include "tests/support/wait_until.h"

#include <gtest/gtest.h>

#include <QVariantMap>

#include <memory>

namespace {

const QString kPluginPath = QStringLiteral(ZAF_PUBLISHING_PLUGIN_PATH);

// A new agent with its form's view loaded, as when the form is presented.
std::unique_ptr<ZafPublishingAgent> makeAgent()
{
    const auto agentClass = zaf::publishing::publishingAgentClass(kPluginPath, QLatin1String(kZafYouTubePublishingAgentClassName));
    if (!agentClass.ok())
        return nullptr;
    std::unique_ptr<ZafPublishingAgent> agent(qobject_cast<ZafPublishingAgent *>(agentClass.value->newInstance()));
    if (agent && !agent->navigationController()->childViewControllers().isEmpty())
        agent->navigationController()->childViewControllers().first()->view();
    return agent;
}

QObject *formOf(ZafPublishingAgent *agent)
{
    const QList<zaf::ui::ViewController *> children = agent->navigationController()->childViewControllers();
    return children.isEmpty() ? nullptr : children.first();
}

QObject *invokeForObject(QObject *target, const char *method)
{
    QObject *result = nullptr;
    QMetaObject::invokeMethod(target, method, Q_RETURN_ARG(QObject *, result));
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
    }

    QStringList events;
    std::optional<zaf::Error> error;
};

class PublishingAgentTest : public ::testing::Test {
protected:
    void SetUp() override
    {
        m_agent = makeAgent();
        ASSERT_NE(m_agent, nullptr);
        m_agent->setDelegate(&m_delegate);
    }

    std::unique_ptr<ZafPublishingAgent> m_agent;
    RecordingDelegate m_delegate;
};

// The plug-in loads with the expected API version and gives its agent class by name (cached); a
// wrong class name, a file that is no plug-in and a missing file are refused with a reason.
TEST(PublishingPluginTest, LoadsThePluginAndFindsTheAgentClassByName)
{
    const auto plugin = zaf::publishing::loadPublishingPlugin(kPluginPath);
    ASSERT_TRUE(plugin.ok()) << plugin.errorText.toStdString();
    EXPECT_EQ(plugin.value->apiVersion(), kZafPublishingPluginApiVersion);

    const auto agentClass = zaf::publishing::publishingAgentClass(kPluginPath, QStringLiteral("ZafYouTubePublishingAgent"));
    ASSERT_TRUE(agentClass.ok()) << agentClass.errorText.toStdString();
    EXPECT_STREQ(agentClass.value->className(), "ZafYouTubePublishingAgent");
    EXPECT_EQ(zaf::publishing::publishingAgentClass(kPluginPath, QStringLiteral("ZafYouTubePublishingAgent")).value,
              agentClass.value);
    std::unique_ptr<QObject> agent(agentClass.value->newInstance());
    EXPECT_NE(qobject_cast<ZafPublishingAgent *>(agent.get()), nullptr);

    const auto missing = zaf::publishing::publishingAgentClass(kPluginPath, QStringLiteral("NoSuchAgent"));
    EXPECT_FALSE(missing.ok());
    EXPECT_TRUE(missing.errorText.contains(QLatin1String("NoSuchAgent")));

    zaf::test::ScratchDir scratch;
    const auto refused = zaf::publishing::loadPublishingPlugin(scratch.write(QStringLiteral("libnot_a_plugin.so"), 64));
    EXPECT_FALSE(refused.ok());
    EXPECT_FALSE(refused.errorText.isEmpty());
    const auto absent = zaf::publishing::publishingAgentClass(scratch.file(QStringLiteral("absent.so")),
                                                               QStringLiteral("ZafYouTubePublishingAgent"));
    EXPECT_FALSE(absent.ok());
    EXPECT_FALSE(absent.errorText.isEmpty());
}

// The names the share action relies on reach the form's table, description cell and categories;
// the form's own routine pre-selects "22" (the picker and cell names are used by the routine below).
TEST_F(PublishingAgentTest, TheFormsNamedInteriorIsReachable)
{
    QObject *form = formOf(m_agent.get());
    ASSERT_NE(form, nullptr);
    auto *table = form->property("_table").value<QObject *>();
    ASSERT_NE(table, nullptr);
    const auto cell = [table](int row) {
        QObject *cell = reinterpret_cast<QObject *>(1);
        EXPECT_TRUE(QMetaObject::invokeMethod(table, "cellForRowInSection", Q_RETURN_ARG(QObject *, cell), Q_ARG(int, 1), Q_ARG(int, row)));
        return cell;
    };
    ASSERT_NE(cell(0), nullptr);
    EXPECT_TRUE(QMetaObject::invokeMethod(cell(0), "setValue", Q_ARG(QString, QStringLiteral("My run"))));
    EXPECT_TRUE(QMetaObject::invokeMethod(cell(0), "setPlaceholderText", Q_ARG(QString, QString())));
    EXPECT_EQ(invokeForString(form, "description"), QStringLiteral("My run"));
    EXPECT_EQ(cell(3), nullptr);

    QStringList ids;
    for (const QVariant &entry : form->property("_categories").toList()) {
        ids << entry.toMap().value(QLatin1String(kZafPublishingCategoryIdKey)).toString();
        EXPECT_FALSE(entry.toMap().value(QLatin1String(kZafPublishingCategoryLabelKey)).toString().isEmpty());
    }
    EXPECT_EQ(ids.size(), 15);
    EXPECT_TRUE(ids.contains(QStringLiteral("20")));
    EXPECT_EQ(form->property("_defaultCategory").toString(), QStringLiteral("22"));
    EXPECT_EQ(invokeForString(form, "categoryId"), QStringLiteral("22"));
    EXPECT_EQ(invokeForString(invokeForObject(form, "_categoryCell"), "categoryString"), QStringLiteral("People & Blogs"));
}

// A replaced default-category routine runs for every later form; an empty one restores the form's own.
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
        EXPECT_EQ(form->property("_defaultCategory").toString(), QStringLiteral("20"));
        EXPECT_EQ(invokeForString(form, "categoryId"), QStringLiteral("20"));
        EXPECT_EQ(invokeForString(invokeForObject(form, "_categoryCell"), "categoryString"), QStringLiteral("Gaming"));
    }
    EXPECT_EQ(calls, 2);

    plugin.value->setFormDefaultCategoryRoutine({});
    auto agent = makeAgent();
    EXPECT_EQ(invokeForString(formOf(agent.get()), "categoryId"), QStringLiteral("22"));
    EXPECT_EQ(calls, 2);
}

// A form that lacks what the activity reaches by name (a renamed method, a missing property) is
// told in the log, and what can still be done is done.
TEST(PublishingPluginTest, AFormMissingANamedMemberIsLoggedNotSilent)
{
    QObject form;
    form.setProperty(kZafFormCategoriesProperty, QVariantList{QVariantMap{{kZafPublishingCategoryIdKey, QStringLiteral("20")},
                                                                          {kZafPublishingCategoryLabelKey, QStringLiteral("Gaming")}}});
    zaf::test::LogCapture log;
    ZafYouTubeActivity::selectDefaultCategoryOfForm(&form);
    EXPECT_EQ(form.property(kZafFormDefaultCategoryProperty).toString(), QStringLiteral("20"));
    EXPECT_EQ(log.messages(QStringLiteral("zaf.publishing.activity")),
              (QStringList{QStringLiteral("the publishing form has no _picker"),
                           QStringLiteral("the publishing form does not answer _categoryCell on QObject")}));
}

TEST_F(PublishingAgentTest, DisplayDoneAndCancelCallTheDelegate)
{
    m_agent->navigationController()->beginAppearanceTransition(true, false);
    m_agent->navigationController()->endAppearanceTransition();
    ASSERT_TRUE(QMetaObject::invokeMethod(m_agent.get(), "doneAction"));
    ASSERT_TRUE(QMetaObject::invokeMethod(m_agent.get(), "cancelAction"));
    EXPECT_EQ(m_delegate.events, (QStringList{QStringLiteral("displayed"), QStringLiteral("done"), QStringLiteral("cancel")}));
}

// Without an access token or a client id to sign in with, publishing ends at once, naming the setting.
TEST_F(PublishingAgentTest, WithoutTokenOrClientIdPublishingEndsAtOnceWithAnError)
{
    qunsetenv("ZAF_YOUTUBE_ACCESS_TOKEN");
    qunsetenv("ZAF_YOUTUBE_CLIENT_ID");
    qputenv("ZAF_YOUTUBE_API_BASE", "http://127.0.0.1:9");
    m_agent->setMediaPath(QStringLiteral("/nonexistent/movie.mp4"));
    ASSERT_TRUE(QMetaObject::invokeMethod(m_agent.get(), "publishAction"));
    qunsetenv("ZAF_YOUTUBE_API_BASE");
    EXPECT_EQ(m_delegate.events, (QStringList{QStringLiteral("begin"), QStringLiteral("end")}));
    ASSERT_TRUE(m_delegate.error.has_value());
    EXPECT_TRUE(m_delegate.error->message.contains(QLatin1String("ZAF_YOUTUBE_CLIENT_ID")));
}

// The browser sign-in: Cancel during it ends it quietly (no end of publishing, even after the time
// limit, its loopback listener closed) and a new Publish signs in afresh; a sign-in abandoned in the
// browser ends publishing with an error after the agent's limit and closes its listener too.
TEST_F(PublishingAgentTest, CancelEndsASignInQuietlyAndAnAbandonedOneEndsAfterItsLimit)
{
    zaf::test::SignInEnvironment signIn;
    m_agent->setMediaPath(QStringLiteral("/nonexistent/movie.mp4"));
    EXPECT_TRUE(m_agent->setProperty("signInTimeoutMs", 100)) << "the limit can be set";

    ASSERT_TRUE(QMetaObject::invokeMethod(m_agent.get(), "publishAction"));
    ASSERT_EQ(signIn.browser.opened.size(), 1);
    EXPECT_EQ(signIn.browser.opened.first().host(), QStringLiteral("accounts.google.com"));
    const quint16 cancelledPort = signIn.browser.redirectPort();
    ASSERT_NE(cancelledPort, 0);
    ASSERT_TRUE(QMetaObject::invokeMethod(m_agent.get(), "cancelAction"));
    EXPECT_FALSE(zaf::test::acceptsConnections(cancelledPort));
    zaf::test::waitUntil([] { return false; }, 300);
    EXPECT_EQ(m_delegate.events, (QStringList{QStringLiteral("begin"), QStringLiteral("cancel")}));

    ASSERT_TRUE(QMetaObject::invokeMethod(m_agent.get(), "publishAction"));
    ASSERT_EQ(signIn.browser.opened.size(), 2) << "a new sign-in";
    const quint16 abandonedPort = signIn.browser.redirectPort();
    ASSERT_TRUE(zaf::test::waitUntil([this] { return m_delegate.events.size() == 4; }, 5000));
    EXPECT_EQ(m_delegate.events.mid(2), (QStringList{QStringLiteral("begin"), QStringLiteral("end")}));
    ASSERT_TRUE(m_delegate.error.has_value());
    EXPECT_TRUE(m_delegate.error->message.contains(QLatin1String("sign-in"))) << m_delegate.error->message.toStdString();
    EXPECT_FALSE(zaf::test::acceptsConnections(abandonedPort));
}

} // namespace
