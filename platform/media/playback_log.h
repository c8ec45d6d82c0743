#pragma once

// The logging category of the playback pipeline: the media engine's "zaf.media".

#include <QLoggingCategory>

namespace zaf::media::playback {
Q_DECLARE_LOGGING_CATEGORY(lcPlayback)
}
