// The extension main routine's refusal of a missing or unusable channel descriptor. These cases
// return before any application object is made, so they run inside this test program.

#include "platform/extensionkit/extension_runtime.h"
#include "tests/platform/extensionkit/socket_pair.h"

#include <QByteArray>

#include <gtest/gtest.h>

#include <fcntl.h>
#include <unistd.h>

using namespace zaf::extensionkit;

namespace {

class ChannelVariable {
public:
    explicit ChannelVariable(const std::optional<QByteArray> &value)
        : m_saved(qgetenv(kChannelFdEnvironmentVariable)), m_wasSet(qEnvironmentVariableIsSet(kChannelFdEnvironmentVariable))
    {
        if (value)
            qputenv(kChannelFdEnvironmentVariable, *value);
        else
            qunsetenv(kChannelFdEnvironmentVariable);
    }
    ~ChannelVariable()
    {
        if (m_wasSet)
            qputenv(kChannelFdEnvironmentVariable, m_saved);
        else
            qunsetenv(kChannelFdEnvironmentVariable);
    }

private:
    QByteArray m_saved;
    bool m_wasSet;
};

} // namespace

TEST(ExtensionMain, MissingOrUnusableChannelDescriptorExitsWithCodeTwo)
{
    const int devNull = ::open("/dev/null", O_RDONLY | O_CLOEXEC);
    ASSERT_GE(devNull, 0);
    int closed[2];
    ASSERT_EQ(::pipe(closed), 0);
    ::close(closed[0]);
    ::close(closed[1]);
    const QList<std::pair<std::optional<QByteArray>, QString>> cases{
        {std::nullopt, "is not set"},
        {QByteArray(""), "is not set"},
        {QByteArray("three"), "not a descriptor number"},
        {QByteArray("-1"), "not a descriptor number"},
        {QByteArray("3x"), "not a descriptor number"},
        {QByteArray::number(closed[0]), "names no open descriptor"},
        {QByteArray::number(devNull), "is not a socket"},
    };
    char name[] = "zaf-test-extension";
    char *argv[] = {name, nullptr};
    for (const auto &[value, reason] : cases) {
        SCOPED_TRACE(value ? value->toStdString() : std::string("(unset)"));
        ChannelVariable variable(value);
        QString error;
        EXPECT_EQ(channelFdFromEnvironment(&error), -1);
        EXPECT_TRUE(error.contains(reason)) << error.toStdString();
        EXPECT_EQ(extensionMain(1, argv, ExtensionDeclaration{}), kExitCodeNoChannel);
    }
    ::close(devNull);
}

TEST(ExtensionMain, ChannelDescriptorOfAConnectedSocketIsAccepted)
{
    zaf::test::SocketPair pair;
    ChannelVariable variable(QByteArray::number(pair.extensionFd()));
    QString error;
    EXPECT_EQ(channelFdFromEnvironment(&error), pair.extensionFd()) << error.toStdString();
}
