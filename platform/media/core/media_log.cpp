#include "platform/media/core/media_log.h"

#include "platform/log.h"

extern "C" {
#include <libavutil/log.h>
}

#include <QString>

#include <cstdarg>
#include <mutex>

Q_LOGGING_CATEGORY(lcFFmpeg, "zaf.ffmpeg")

namespace zaf::media {

namespace {

void routeFFmpegMessage(void *context, int level, const char *format, va_list args)
{
    if (level > AV_LOG_WARNING)
        return;
    char line[1024];
    int printPrefix = 1;
    av_log_format_line2(context, level, format, args, line, sizeof line, &printPrefix);
    const QString text = QString::fromUtf8(line).trimmed();
    if (text.isEmpty())
        return;
    if (level <= AV_LOG_ERROR)
        log::error(lcFFmpeg(), text);
    else
        log::info(lcFFmpeg(), text);
}

} // namespace

const QLoggingCategory &lcMedia()
{
    static const QLoggingCategory category("zaf.media");
    return category;
}

const QLoggingCategory &lcPlayback()
{
    static const QLoggingCategory category("zaf.media.playback");
    return category;
}

const QLoggingCategory &lcExport()
{
    static const QLoggingCategory category("zaf.media.export");
    return category;
}

void ensureFFmpegLogging()
{
    static std::once_flag once;
    std::call_once(once, [] {
        av_log_set_level(AV_LOG_WARNING);
        av_log_set_callback(routeFFmpegMessage);
    });
}

} // namespace zaf::media
