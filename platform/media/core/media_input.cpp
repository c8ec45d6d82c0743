#include "platform/media/core/media_input.h"

#include <QFile>

namespace zaf::media {

ff::InputFormatContextPtr openInput(const QString &path, const CancelToken &cancel, QString *error)
{
    if (cancel.isCancelled()) {
        *error = QStringLiteral("cannot open %1: cancelled").arg(path);
        return {};
    }
    AVFormatContext *raw = avformat_alloc_context();
    if (!raw) {
        *error = QStringLiteral("out of memory opening %1").arg(path);
        return {};
    }
    raw->interrupt_callback = AVIOInterruptCB{&CancelToken::interruptCallback, const_cast<CancelToken *>(&cancel)};
    // Always a local file: the "file:" prefix keeps a name like "clip:1.mp4" from being read as a
    // protocol, and the whitelist keeps a crafted file from making the demuxer open anything else.
    const QByteArray url = QByteArrayLiteral("file:") + QFile::encodeName(path);
    ff::Dictionary options;
    options.set("protocol_whitelist", "file");
    int rc = avformat_open_input(&raw, url.constData(), nullptr, options.address());
    if (rc < 0) { // avformat_open_input frees the context on failure
        *error = QStringLiteral("cannot open %1: %2").arg(path, cancel.isCancelled() ? QStringLiteral("cancelled") : ff::errorString(rc));
        return {};
    }
    ff::InputFormatContextPtr format(raw);
    rc = avformat_find_stream_info(format.get(), nullptr);
    if (rc < 0 && !cancel.isCancelled()) {
        *error = QStringLiteral("cannot read the streams of %1: %2").arg(path, ff::errorString(rc));
        return {};
    }
    // Probing can also stop early on an interrupt without reporting an error.
    if (cancel.isCancelled()) {
        *error = QStringLiteral("cannot read the streams of %1: cancelled").arg(path);
        return {};
    }
    return format;
}

double containerStartSeconds(const AVFormatContext *format)
{
    if (!format || format->start_time == AV_NOPTS_VALUE)
        return 0;
    return double(format->start_time) / AV_TIME_BASE;
}

} // namespace zaf::media
