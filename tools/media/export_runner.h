#pragma once

// Runs an export to its end on the calling thread, drawing a progress bar on a terminal.

#include <memory>

namespace zaf::media {
class ExportSession;
}

namespace zaf::tools {

// Starts the export, shows its progress on standard error when that is a terminal, waits for its
// completion and returns the exit code: 0 when it completed, 1 with the error printed otherwise.
// SIGINT cancels the export.
int runExport(const std::shared_ptr<zaf::media::ExportSession> &session, const char *verb);

} // namespace zaf::tools
