// Which folder --watch watches: the default is Screencasts in the Videos folder the user's
// user-dirs.dirs names; a folder the user names must exist; the video library is never watched.
#include "host/watch/watch_mode.h"
#include "tests/support/named_cases.h"
#include "tests/support/temp_dir.h"

#include <QDir>
#include <QFile>
#include <QHash>

#include <gtest/gtest.h>

namespace zaf::host::watch {
namespace {

ZAF_PRINT_CASES_AS_NAMES

// Sets environment variables for one test and puts the old values back.
class ScopedEnvironment {
public:
    void set(const char *name, const QString &value)
    {
        if (!m_saved.contains(name))
            m_saved.insert(name, qEnvironmentVariableIsSet(name) ? std::optional<QByteArray>(qgetenv(name)) : std::nullopt);
        value.isNull() ? qunsetenv(name) : qputenv(name, value.toLocal8Bit());
    }
    ~ScopedEnvironment()
    {
        for (auto it = m_saved.cbegin(); it != m_saved.cend(); ++it)
            it.value() ? qputenv(it.key().constData(), *it.value()) : qunsetenv(it.key().constData());
    }

private:
    QHash<QByteArray, std::optional<QByteArray>> m_saved;
};

class WatchFolder : public ::testing::Test {
protected:
    void SetUp() override
    {
        QDir().mkpath(scratch.file(QStringLiteral("home/.config")));
        environment.set("HOME", scratch.file(QStringLiteral("home")));
        environment.set("XDG_CONFIG_HOME", scratch.file(QStringLiteral("home/.config")));
        environment.set("ZAF_VIDEO_LIBRARY", QString());
    }
    test::ScratchDir scratch;
    ScopedEnvironment environment;
};

TEST_F(WatchFolder, DefaultIsScreencastsInTheVideosFolderOfUserDirs)
{
    EXPECT_EQ(defaultWatchFolder(), scratch.file(QStringLiteral("home/Videos/Screencasts")));
    QFile dirs(scratch.file(QStringLiteral("home/.config/user-dirs.dirs")));
    ASSERT_TRUE(dirs.open(QIODevice::WriteOnly));
    dirs.write("XDG_VIDEOS_DIR=\"$HOME/Filme\"\n");
    dirs.close();
    QDir().mkpath(scratch.file(QStringLiteral("home/Filme")));
    EXPECT_EQ(defaultWatchFolder(), scratch.file(QStringLiteral("home/Filme/Screencasts")));
}

struct ProblemCase {
    const char *name;
    const char *folder;  // under the scratch folder
    bool given;          // named by the user
    const char *library; // $ZAF_VIDEO_LIBRARY under the scratch folder; "" for none
    const char *problem; // what the problem says; "" for none
};

class WatchFolderProblem : public WatchFolder, public ::testing::WithParamInterface<ProblemCase> {};

TEST_P(WatchFolderProblem, RefusesAMissingFolderGivenAndTheLibrary)
{
    const ProblemCase &c = GetParam();
    QDir().mkpath(scratch.file(QStringLiteral("home/Videos")));
    QDir().mkpath(scratch.file(QStringLiteral("recordings")));
    QFile::link(scratch.file(QStringLiteral("recordings")), scratch.file(QStringLiteral("link")));
    if (*c.library)
        environment.set("ZAF_VIDEO_LIBRARY", scratch.file(QLatin1String(c.library)));
    const std::optional<QString> problem = watchFolderProblem(scratch.file(QLatin1String(c.folder)), c.given);
    EXPECT_EQ(problem.value_or(QString()).contains(QLatin1String(c.problem)), true) << problem.value_or(QString()).toStdString();
    EXPECT_EQ(problem.has_value(), *c.problem != '\0') << problem.value_or(QString()).toStdString();
}

INSTANTIATE_TEST_SUITE_P(
    Folders, WatchFolderProblem,
    ::testing::Values(ProblemCase{"GivenAndThere", "recordings", true, "", ""},
                      ProblemCase{"GivenAndMissing", "missing", true, "", "does not exist"},
                      ProblemCase{"DefaultAndMissing", "home/Videos/Screencasts", false, "", ""},
                      ProblemCase{"TheVideosFolder", "home/Videos", true, "", "is the video library"},
                      ProblemCase{"TheLibraryThroughALink", "link", true, "recordings", "is the video library"},
                      ProblemCase{"VideosWhenTheLibraryIsElsewhere", "home/Videos", true, "recordings", ""}),
    test::caseName);

} // namespace
} // namespace zaf::host::watch
