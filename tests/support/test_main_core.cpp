// The main routine of the non-graphical test programs: a QCoreApplication, so that the main queue
// exists, then every test on the main thread.
#include <QCoreApplication>
#include <gtest/gtest.h>

int main(int argc, char **argv)
{
    ::testing::InitGoogleTest(&argc, argv);
    QCoreApplication app(argc, argv);
    return RUN_ALL_TESTS();
}
