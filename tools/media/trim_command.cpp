// zaf-media trim IN OUT --start S --end E: the editor's trim export of the range [S, E) seconds.
#include "platform/media/export_session.h"
#include "platform/media/media_asset.h"
#include "tools/media/commands.h"
#include "tools/media/export_runner.h"

#include <QUrl>

namespace zaf::tools {

int trimCommand(const QStringList &args)
{
    using namespace zaf::media;
    const QString usage = QStringLiteral("usage: zaf-media trim IN OUT --start SECONDS --end SECONDS");
    if (args.size() != 6 || args[2] != QLatin1String("--start") || args[4] != QLatin1String("--end"))
        return fail(usage);
    bool okStart = false, okEnd = false;
    const double start = args[3].toDouble(&okStart), end = args[5].toDouble(&okEnd);
    if (!okStart || !okEnd || start < 0 || end <= start)
        return fail(QStringLiteral("the range needs 0 <= start < end; ") + usage);

    const std::shared_ptr<MediaAsset> asset = MediaAsset::assetWithURL(QUrl::fromLocalFile(args[0]));
    const std::shared_ptr<ExportSession> session =
        ExportSession::exportSessionWithAsset(asset, QLatin1String(kExportPresetHighestQuality));
    if (!session)
        return fail(QStringLiteral("cannot export %1").arg(args[0]));
    session->setOutputURL(QUrl::fromLocalFile(args[1]));
    session->setOutputFileType(QLatin1String(kFileTypeMPEG4));
    // The editor converts seconds with the player's timescale (nanoseconds).
    constexpr std::int32_t kTimescale = 1000000000;
    session->setTimeRange(MediaTimeRange::fromStartEnd(MediaTime::fromSeconds(start, kTimescale),
                                                       MediaTime::fromSeconds(end, kTimescale)));
    return runExport(session, "trim");
}

} // namespace zaf::tools
