// The main routine of the test programs that need widgets or images: a QApplication on the
// offscreen platform (unless the environment names another), then every test on the main thread.
#include <QApplication>
#include <gtest/gtest.h>

#include <sys/stat.h>
#include <unistd.h>

int main(int argc, char **argv)
{
    ::testing::InitGoogleTest(&argc, argv);
    if (qEnvironmentVariableIsEmpty("QT_QPA_PLATFORM"))
        qputenv("QT_QPA_PLATFORM", "offscreen");
    // A private runtime directory, as a desktop session has one (Qt warns without it).
    if (qEnvironmentVariableIsEmpty("XDG_RUNTIME_DIR")) {
        const QByteArray dir = "/tmp/zaf-test-runtime-" + QByteArray::number(::getuid());
        ::mkdir(dir.constData(), 0700);
        qputenv("XDG_RUNTIME_DIR", dir);
    }
    QApplication app(argc, argv);
    return RUN_ALL_TESTS();
}
