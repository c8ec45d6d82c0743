#include "platform/media/export/export_output_file.h"

#include "platform/media/export/export_common.h"

#include <cerrno>

namespace zaf::media::exportpipe {

namespace {

// A file error in the POSIX domain, told as the export's error.
Error exportError(const Error &posix, const QString &what)
{
    int code = kMediaErrorWriteFailed;
    if (posix.code == ENOSPC || posix.code == EDQUOT)
        code = kMediaErrorDiskFull;
    else if (posix.code == EEXIST)
        code = kMediaErrorOutputExists;
    return makeMediaError(code, QStringLiteral("%1: %2").arg(what, posix.message));
}

} // namespace

std::unique_ptr<ExportOutputFile> ExportOutputFile::create(const QString &destination, Error *error)
{
    Result<std::unique_ptr<AtomicFile>> file = AtomicFile::create(destination);
    if (!file.ok()) {
        *error = exportError(*file.error, file.error->code == EEXIST ? QStringLiteral("the output file exists")
                                                                     : QStringLiteral("cannot create the output file"));
        return nullptr;
    }
    return std::unique_ptr<ExportOutputFile>(new ExportOutputFile(std::move(*file.value)));
}

OptionalError ExportOutputFile::commit()
{
    if (OptionalError e = m_file->commit())
        return exportError(*e, QStringLiteral("cannot move the export into place"));
    return std::nullopt;
}

} // namespace zaf::media::exportpipe
