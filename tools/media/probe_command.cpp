// zaf-media probe FILE: the movie's duration and tracks as JSON on standard output.
#include "platform/media/media_asset.h"
#include "tools/media/commands.h"

#include <QJsonArray>
#include <QJsonDocument>
#include <QJsonObject>
#include <QUrl>

#include <cstdio>

namespace zaf::tools {

namespace {

using namespace zaf::media;

QString typeName(MediaType type)
{
    switch (type) {
    case MediaType::Video:
        return QStringLiteral("video");
    case MediaType::Audio:
        return QStringLiteral("audio");
    default:
        return QStringLiteral("other");
    }
}

QJsonObject trackJson(const AssetTrack &track)
{
    QJsonObject o;
    o.insert(QStringLiteral("id"), track.trackID);
    o.insert(QStringLiteral("type"), typeName(track.mediaType));
    o.insert(QStringLiteral("codec"), track.codecName);
    if (track.duration.isNumeric())
        o.insert(QStringLiteral("duration"), track.duration.seconds());
    if (track.mediaType == MediaType::Video) {
        const AffineTransform &t = track.preferredTransform;
        o.insert(QStringLiteral("natural_size"),
                 QJsonArray{track.naturalSize.width(), track.naturalSize.height()});
        o.insert(QStringLiteral("transform"), QJsonArray{t.a, t.b, t.c, t.d, t.tx, t.ty});
        const QSizeF display = t.mapSize(track.naturalSize);
        o.insert(QStringLiteral("display_size"), QJsonArray{display.width(), display.height()});
        o.insert(QStringLiteral("rotation"), t.rotationDegrees());
        o.insert(QStringLiteral("frame_rate"), track.nominalFrameRate);
    } else if (track.mediaType == MediaType::Audio) {
        o.insert(QStringLiteral("sample_rate"), track.sampleRate);
        o.insert(QStringLiteral("channels"), track.channelCount);
    }
    return o;
}

} // namespace

int probeCommand(const QStringList &args)
{
    if (args.size() != 1)
        return fail(QStringLiteral("usage: zaf-media probe FILE"));
    const std::shared_ptr<MediaAsset> asset = MediaAsset::assetWithURL(QUrl::fromLocalFile(args[0]));
    if (!asset->load()) {
        const OptionalError error = asset->loadError();
        return fail(QStringLiteral("cannot read %1: %2").arg(args[0], error ? error->message : QString()));
    }
    QJsonArray tracks;
    for (const AssetTrack &track : asset->tracks())
        tracks.append(trackJson(track));
    QJsonObject root;
    root.insert(QStringLiteral("file"), args[0]);
    root.insert(QStringLiteral("duration"), asset->duration().seconds());
    root.insert(QStringLiteral("tracks"), tracks);
    std::fputs(QJsonDocument(root).toJson(QJsonDocument::Indented).constData(), stdout);
    return 0;
}

} // namespace zaf::tools
