// zaf-media mix IN [OUT]: every audio track mixed into one, the video copied. Without OUT the
// result goes to the editor's own temporary-file name, which is printed.
#include "media/audio_mix_utility.h"
#include "platform/media/export_session.h"
#include "tempstore/temp_store.h"
#include "tools/media/commands.h"
#include "tools/media/export_runner.h"

#include <QUrl>

#include <cstdio>

namespace zaf::tools {

int mixCommand(const QStringList &args)
{
    if (args.size() != 1 && args.size() != 2)
        return fail(QStringLiteral("usage: zaf-media mix IN [OUT]"));
    if (args.size() == 1)
        ZafTempStore::defaultStore().prepareAtProcessStart();
    const QUrl output = args.size() == 2 ? QUrl::fromLocalFile(args[1]) : ZafAudioMixUtility::tempFileURL();
    const auto session = ZafAudioMixUtility::exportSessionForMixingAudio(QUrl::fromLocalFile(args[0]), output);
    if (!session)
        return fail(QStringLiteral("cannot export %1").arg(args[0]));
    const int rc = runExport(session, "mix");
    if (rc == 0)
        std::printf("%s\n", qPrintable(output.toLocalFile()));
    return rc;
}

} // namespace zaf::tools
