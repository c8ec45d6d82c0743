#include "publishing/plugin/signin/youtube_client.h"

#include "platform/files/atomic_file.h"
#include "platform/files/file_manager.h"

#include <QDir>
#include <QFileInfo>
#include <QRegularExpression>
#include <QSettings>
#include <QStandardPaths>

#include <sys/stat.h>
#include <unistd.h>

namespace zaf::publishing {

namespace {

constexpr const char *kIdKey = "client/id";
constexpr const char *kSecretKey = "client/secret";

} // namespace

QString youTubeClientSettingsPath()
{
    return QDir(QStandardPaths::writableLocation(QStandardPaths::GenericConfigLocation))
        .filePath(QStringLiteral("zafrel/youtube-client.ini"));
}

std::optional<YouTubeClient> configuredYouTubeClient()
{
    const QString id = qEnvironmentVariable("ZAF_YOUTUBE_CLIENT_ID").trimmed();
    if (!id.isEmpty())
        return YouTubeClient{id, qEnvironmentVariable("ZAF_YOUTUBE_CLIENT_SECRET").trimmed()};
    const QString path = youTubeClientSettingsPath();
    if (!QFileInfo(path).isFile())
        return std::nullopt;
    const QSettings settings(path, QSettings::IniFormat);
    YouTubeClient client{settings.value(QLatin1String(kIdKey)).toString().trimmed(),
                         settings.value(QLatin1String(kSecretKey)).toString().trimmed()};
    if (client.id.isEmpty())
        return std::nullopt;
    return client;
}

OptionalError saveYouTubeClient(const YouTubeClient &client)
{
    const QString id = client.id.trimmed(), secret = client.secret.trimmed();
    // What OAuth clients are made of; anything else would need quoting in the file.
    static const QRegularExpression plain(QStringLiteral("^[A-Za-z0-9._~+/-]*$"));
    if (id.isEmpty() || !plain.match(id).hasMatch() || !plain.match(secret).hasMatch())
        return Error::fromErrno(EINVAL, QStringLiteral("the client id or secret"));
    const QString path = youTubeClientSettingsPath();
    if (OptionalError e = FileManager::defaultManager().createDirectoryAtPath(QFileInfo(path).absolutePath(), true, 0700))
        return e;
    // The one atomic write never replaces a file: the old settings go first. A crash between the two
    // steps leaves no client, which the next setup writes again.
    if (QFileInfo::exists(path)) {
        if (OptionalError e = FileManager::defaultManager().removeItemAtPath(path))
            return e;
    }
    Result<std::unique_ptr<AtomicFile>> file = AtomicFile::create(path);
    if (!file.ok())
        return file.error;
    const QByteArray text = "[client]\nid=" + id.toUtf8() + "\nsecret=" + secret.toUtf8() + "\n";
    const int fd = (*file.value)->descriptor();
    // The secret is the user's alone.
    if (::fchmod(fd, S_IRUSR | S_IWUSR) != 0 || ::write(fd, text.constData(), size_t(text.size())) != text.size())
        return Error::fromErrno(errno ? errno : EIO, path);
    return (*file.value)->commit();
}

} // namespace zaf::publishing
