#pragma once

// The output file of an export (private to platform/media): an AtomicFile whose errors are told in
// the media domain. Until commit() succeeds the destination name is never touched; dropping the
// object removes the temporary file, so a failed or cancelled export leaves nothing behind. Used on
// the export's worker thread.

#include "platform/error.h"
#include "platform/files/atomic_file.h"

#include <QString>

#include <memory>

namespace zaf::media::exportpipe {

class ExportOutputFile {
public:
    // Reserves a fresh temporary file beside `destination`. Fails with kMediaErrorOutputExists
    // when the destination exists and kMediaErrorWriteFailed when its directory is not writable.
    static std::unique_ptr<ExportOutputFile> create(const QString &destination, Error *error);

    // Where the export writes, by name.
    QString temporaryPath() const { return m_file->temporaryPath(); }
    QString destination() const { return m_file->destination(); }

    // Flushes the temporary file to disk and puts it at the destination, never replacing an
    // existing file (kMediaErrorOutputExists). On failure the temporary file is gone.
    OptionalError commit();
    // Removes the temporary file (also done by the destructor when not committed).
    void discard() { m_file->discard(); }

private:
    explicit ExportOutputFile(std::unique_ptr<AtomicFile> file) : m_file(std::move(file)) {}
    std::unique_ptr<AtomicFile> m_file;
};

} // namespace zaf::media::exportpipe
