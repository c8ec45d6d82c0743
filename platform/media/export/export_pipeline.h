#pragma once

// The export pipeline (private to platform/media): demuxes the source, routes every stream to its
// stage (packet copy, ExportVideoEncoder, ExportAudioEncoder) and muxes the results into an MPEG-4
// file. It knows nothing of sessions, statuses or file naming; ExportSession wires it.
//
// runExport() runs on the caller's thread (the export's worker thread) from start to end; the
// progress callback runs on that same thread.

#include "platform/media/export/export_common.h"

#include <QList>
#include <QString>

#include <functional>
#include <optional>

namespace zaf::media::exportpipe {

struct ExportJob {
    QString sourcePath;
    QString outputPath;                        // written in place (the caller renames it afterwards)
    struct Cut {
        std::int64_t startMicros = 0;          // relative to the movie's start
        std::int64_t endMicros = 0;
    };
    std::optional<Cut> cut;                    // none: the whole movie
    std::optional<QList<int>> mixStreamIndices; // set: mix these audio streams into one track
    double durationSeconds = 0;                // the source's duration, for progress
};

// Runs the job to its end. No error on success; kMediaErrorCancelled once `cancel` is set.
OptionalError runExport(const ExportJob &job, const CancelToken &cancel, const std::function<void(float)> &progress);

} // namespace zaf::media::exportpipe
