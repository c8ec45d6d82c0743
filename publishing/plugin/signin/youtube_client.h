#pragma once

// The OAuth client the publishing plug-in signs in to YouTube with. A user sets one up once (their
// own client of the installed-application kind, see the README) in a settings file of their XDG
// config directory, $XDG_CONFIG_HOME/zafrel/youtube-client.ini:
//
//   [client]
//   id=1234-abcd.apps.googleusercontent.com
//   secret=GOCSPX-...
//
// by hand or with `zaf-youtube-setup`. $ZAF_YOUTUBE_CLIENT_ID and $ZAF_YOUTUBE_CLIENT_SECRET override
// the file. Any thread.

#include "platform/error.h"

#include <QString>

#include <optional>

namespace zaf::publishing {

struct YouTubeClient {
    QString id;
    QString secret; // may be empty
};

// The settings file's path (which need not exist).
QString youTubeClientSettingsPath();
// The configured client: the environment's, else the settings file's; none when neither names an id.
std::optional<YouTubeClient> configuredYouTubeClient();
// Writes the settings file, readable by the user only, replacing the client it held.
OptionalError saveYouTubeClient(const YouTubeClient &client);

} // namespace zaf::publishing
