// zaf-upload-test-server: the loopback upload server on its own, for screenshots and trying the
// publishing flow by hand. Prints its base URL on the first line of stdout, then serves until its
// lifetime ends.
//
//   zaf-upload-test-server [--delay-ms N] [--lifetime-s S] [--token TOKEN]
#include "tests/publishing/upload_test_server.h"

#include <QCoreApplication>

#include <cstdio>

int main(int argc, char **argv)
{
    QCoreApplication app(argc, argv);
    const QStringList args = app.arguments().mid(1);
    int delayMs = 0, lifetimeS = 120;
    QByteArray token = "test-token";
    for (int i = 0; i < args.size(); i += 2) {
        bool ok = i + 1 < args.size();
        const QString value = args.value(i + 1);
        if (args[i] == QLatin1String("--delay-ms"))
            delayMs = value.toInt(&ok);
        else if (args[i] == QLatin1String("--lifetime-s"))
            lifetimeS = value.toInt(&ok);
        else if (args[i] == QLatin1String("--token"))
            token = value.toUtf8();
        else
            ok = false;
        if (!ok || delayMs < 0 || lifetimeS <= 0 || lifetimeS > 3600) {
            std::fprintf(stderr, "usage: zaf-upload-test-server [--delay-ms N] [--lifetime-s 1..3600] [--token TOKEN]\n");
            return 2;
        }
    }
    zaf::test::UploadTestServer server(1000, std::chrono::seconds(lifetimeS));
    server.setExpectedToken(token);
    server.setResponseDelay(std::chrono::milliseconds(delayMs));
    if (!server.listen()) {
        std::fprintf(stderr, "zaf-upload-test-server: cannot listen on 127.0.0.1\n");
        return 1;
    }
    std::printf("%s\n", server.baseUrl().toString().toUtf8().constData());
    std::fflush(stdout);
    // The server closes itself at the end of its lifetime; the process ends a moment later.
    QTimer::singleShot(std::chrono::seconds(lifetimeS) + std::chrono::milliseconds(100), &app, &QCoreApplication::quit);
    return app.exec();
}
