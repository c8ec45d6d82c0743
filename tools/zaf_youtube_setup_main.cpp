// zaf-youtube-setup: sets up the OAuth client the editor publishes to YouTube with, and forgets a
// kept sign-in.
//
//   zaf-youtube-setup --client-id ID [--client-secret SECRET]   writes the user's settings file
//   zaf-youtube-setup --forget-sign-in                           removes the kept sign-in
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
    parser.addOptions({idOption, secretOption, forgetOption});
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
