#pragma once

// The output file of an export (private to platform/media): written under a temporary name in the
// destination's directory, then put in place without replacing anything. Until commit() succeeds
// the destination name is never touched; dropping the object removes the temporary file, so a
// failed or cancelled export leaves nothing behind. Used on the export's worker thread.

#include "platform/error.h"

#include <QString>

#include <memory>

namespace zaf::media::exportpipe {

class ExportOutputFile {
public:
    // Reserves a fresh temporary file beside `destination`. Fails with kMediaErrorOutputExists
    // when the destination exists and kMediaErrorWriteFailed when its directory is not writable.
    static std::unique_ptr<ExportOutputFile> create(const QString &destination, Error *error);
    ~ExportOutputFile();

    QString temporaryPath() const { return m_temporaryPath; }
    QString destination() const { return m_destination; }

    // Flushes the temporary file to disk and renames it to the destination, never replacing an
    // existing file (kMediaErrorOutputExists).
    OptionalError commit();
    // Removes the temporary file (also done by the destructor when not committed).
    void discard();

private:
    ExportOutputFile(QString destination, QString temporaryPath);
    QString m_destination;
    QString m_temporaryPath;
    bool m_done = false;
};

} // namespace zaf::media::exportpipe
