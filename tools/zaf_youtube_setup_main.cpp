// zaf-youtube-setup: sets up the OAuth client the editor publishes to YouTube with, and forgets a
// kept sign-in.
//
//   zaf-youtube-setup --client-id ID [--client-secret SECRET]   writes the user's settings file
//   zaf-youtube-setup --forget-sign-in                           removes the kept sign-in
//   zaf-youtube-setup --check-secret-store                       keeps, reads back and forgets a probe
//                                                                entry: whether sign-ins can be kept
//   zaf-youtube-setup                                            says where the settings are, and what they hold
//
// Exit status: 0 when done, 1 when the settings or the secret store refused, 2 for bad arguments.

#include "platform/log.h"
#include "publishing/plugin/signin/refresh_token_store.h"
#include "publishing/plugin/signin/youtube_client.h"

#include <QCommandLineParser>
#include <QCoreApplication>

#include <cstdio>

using namespace zaf::publishing;

namespace {

// Keeps a probe entry, reads it back and forgets it, as a publish keeps, reads and forgets a sign-in.
int checkSecretStore(QCoreApplication &app)
{
    const QString probeClient = QStringLiteral("zafrel-secret-store-check");
    const QString probe = QStringLiteral("probe-%1").arg(QCoreApplication::applicationPid());
    int status = 1;
    storeRefreshToken(probeClient, probe, [&](zaf::OptionalError stored) {
        if (stored) {
            std::fprintf(stderr, "zaf-youtube-setup: the secret store cannot keep sign-ins: %s\n", qPrintable(stored->description()));
            app.quit();
            return;
        }
        readRefreshToken(probeClient, [&](const QString &read) {
            forgetRefreshToken(probeClient, [&, read](zaf::OptionalError forgotten) {
                if (read != probe)
                    std::fprintf(stderr, "zaf-youtube-setup: the secret store gave back something else than it was given\n");
                else if (forgotten)
                    std::fprintf(stderr, "zaf-youtube-setup: the secret store cannot forget: %s\n", qPrintable(forgotten->description()));
                else
                    std::printf("The secret store keeps sign-ins.\n");
                status = read == probe && !forgotten ? 0 : 1;
                app.quit();
            });
        });
    });
    app.exec();
    return status;
}

} // namespace

int main(int argc, char **argv)
{
    QCoreApplication app(argc, argv);
    zaf::log::hideInformationalEntriesByDefault();
    QCommandLineParser parser;
    parser.setApplicationDescription(QStringLiteral("Sets up the OAuth client the video editor publishes to YouTube with."));
    parser.addHelpOption();
    const QCommandLineOption idOption(QStringLiteral("client-id"), QStringLiteral("The OAuth client's id."), QStringLiteral("ID"));
    const QCommandLineOption secretOption(QStringLiteral("client-secret"), QStringLiteral("The OAuth client's secret."), QStringLiteral("SECRET"));
    const QCommandLineOption forgetOption(QStringLiteral("forget-sign-in"), QStringLiteral("Forget the sign-in kept for the client."));
    const QCommandLineOption checkOption(QStringLiteral("check-secret-store"),
                                         QStringLiteral("Check that the desktop's secret store can keep a sign-in."));
    parser.addOptions({idOption, secretOption, forgetOption, checkOption});
    parser.process(app);
    if (!parser.positionalArguments().isEmpty() || (parser.isSet(secretOption) && !parser.isSet(idOption))) {
        std::fprintf(stderr, "%s", qPrintable(parser.helpText()));
        return 2;
    }

    if (parser.isSet(idOption)) {
        if (const zaf::OptionalError e = saveYouTubeClient({parser.value(idOption), parser.value(secretOption)})) {
            std::fprintf(stderr, "zaf-youtube-setup: cannot write %s: %s\n", qPrintable(youTubeClientSettingsPath()), qPrintable(e->description()));
            return 1;
        }
        std::printf("The client is set up in %s.\n", qPrintable(youTubeClientSettingsPath()));
        return 0;
    }
    if (parser.isSet(checkOption))
        return checkSecretStore(app);
    const std::optional<YouTubeClient> client = configuredYouTubeClient();
    if (parser.isSet(forgetOption)) {
        if (!client) {
            std::printf("No client is set up, so no sign-in is kept.\n");
            return 0;
        }
        int status = 0;
        forgetRefreshToken(client->id, [&](zaf::OptionalError e) {
            if (e)
                std::fprintf(stderr, "zaf-youtube-setup: the secret store refused: %s\n", qPrintable(e->description()));
            else
                std::printf("The sign-in is forgotten; the next publish signs in in the browser.\n");
            status = e ? 1 : 0;
            app.quit();
        });
        app.exec();
        return status;
    }
    std::printf("settings: %s\nclient:   %s\n", qPrintable(youTubeClientSettingsPath()),
                client ? qPrintable(client->id + (client->secret.isEmpty() ? QStringLiteral(" (no secret)") : QStringLiteral(" (with a secret)")))
                       : "none set up");
    return 0;
}
