#pragma once

// The check a smart cut passes before it reports success (private to platform/media): the pictures
// on both sides of every splice point of the written movie are decoded, and every one must decode
// without an error. Runs on the export's worker thread.

#include "platform/media/core/cancel_token.h"

#include <QList>
#include <QString>

#include <cstdint>
#include <optional>

namespace zaf::media::exportpipe {

// How many pictures after each splice point are decoded; before it, everything back to the
// preceding keyframe is, since those pictures cannot be decoded without it.
inline constexpr int kPicturesCheckedAfterSplice = 4;

// Why the video of the movie at `path` fails to decode around one of `spliceMicros` (output
// times); null if every picture there decodes.
std::optional<QString> checkSplices(const QString &path, const QList<std::int64_t> &spliceMicros, const CancelToken &cancel);

} // namespace zaf::media::exportpipe
