// The C interface of the host library (include/zafrel/host.h) over PolledSession.

#include "zafrel/host.h"

#include "host/input_items.h"
#include "host/library/polled_session.h"
#include "platform/install_layout.h"

#include <QByteArray>
#include <QDir>
#include <QFileInfo>
#include <QString>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <new>
#include <vector>

#include <dlfcn.h>
#include <poll.h>

struct zafrel_host_session {
    zaf::host::PolledSession session;
    QList<zaf::host::InputItem> items; // in the order given, one per key
    QByteArray error;                  // the last failure, UTF-8
    bool answered = false; // a report or a refusal came: the view is to be removed
};

namespace {

constexpr const char *kExtensionName = zaf::install::kExtensionProgram;

int failed(zafrel_host_session *s, const QString &message)
{
    s->error = message.toUtf8();
    return -1;
}

// The prefix this library is installed under: its folder is PREFIX/LIBDIR (ZAF_HOST_LIBDIR, e.g.
// "lib" or "lib/x86_64-linux-gnu").
QString installPrefix()
{
    Dl_info info{};
    if (::dladdr(reinterpret_cast<const void *>(&zafrel_host_extension_path), &info) == 0 || !info.dli_fname)
        return {};
    QString folder = QFileInfo(QFile::decodeName(info.dli_fname)).canonicalPath();
    const QString libdir = QStringLiteral(ZAF_HOST_LIBDIR);
    if (!folder.endsWith(QLatin1Char('/') + libdir))
        return {};
    folder.chop(libdir.size() + 1);
    return folder;
}

} // namespace

extern "C" {

zafrel_host_session *zafrel_host_session_new(void)
{
    return new (std::nothrow) zafrel_host_session;
}

void zafrel_host_session_free(zafrel_host_session *session)
{
    delete session;
}

int zafrel_host_session_add_item(zafrel_host_session *session, const char *key, const char *value)
{
    if (!key || !value || !*key)
        return failed(session, QStringLiteral("an item needs a key and a value"));
    if (session->session.isStarted())
        return failed(session, QStringLiteral("items cannot be added once the session has started"));
    const QString title = QString::fromUtf8(key);
    zaf::host::InputItem item = zaf::host::makeTextItem(title, QString::fromUtf8(value));
    if (title == zaf::host::ZafVideoEditorExtensionOverrideTintColorKey) {
        const std::optional<zaf::host::InputItem> tint = zaf::host::makeTintColorItem(QString::fromUtf8(value));
        if (!tint)
            return failed(session, QStringLiteral("the tint \"%1\" is no colour #RRGGBB or #RRGGBBAA").arg(QString::fromUtf8(value)));
        item = *tint;
    }
    session->items.removeIf([&](const zaf::host::InputItem &given) { return given.title == title; });
    session->items.append(item);
    session->error.clear();
    return 0;
}

int zafrel_host_session_start(zafrel_host_session *session, const char *extension_path, const zafrel_host_callbacks *callbacks,
                              void *user_data)
{
    for (const QLatin1String key : {zaf::host::ZafVideoEditorExtensionMoviePathKey, zaf::host::ZafVideoEditorExtensionAppNameKey,
                                    zaf::host::ZafVideoEditorExtensionBundleIdentifierKey}) {
        if (std::none_of(session->items.begin(), session->items.end(), [&](const auto &item) { return item.title == key; }))
            return failed(session, QStringLiteral("the item %1 is required").arg(key));
    }
    const char *extension = extension_path ? extension_path : zafrel_host_extension_path();
    if (!extension)
        return failed(session, QStringLiteral("the extension %1 is not installed beside this library").arg(QLatin1String(kExtensionName)));

    const zafrel_host_callbacks given = callbacks ? *callbacks : zafrel_host_callbacks{};
    zaf::host::PolledSession::Callbacks wrapped;
    wrapped.accepted = [given, user_data](const QString &version) {
        if (given.accepted)
            given.accepted(user_data, version.toUtf8().constData());
    };
    wrapped.refused = [session, given, user_data](int code, const QString &message) {
        session->answered = true;
        if (given.refused)
            given.refused(user_data, code, message.toUtf8().constData());
    };
    wrapped.reported = [session, given, user_data](const QStringList &types) {
        session->answered = true;
        if (!given.reported)
            return;
        std::vector<QByteArray> storage;
        std::vector<const char *> pointers;
        for (const QString &type : types)
            storage.push_back(type.toUtf8());
        for (const QByteArray &type : storage)
            pointers.push_back(type.constData());
        given.reported(user_data, pointers.data(), pointers.size());
    };
    wrapped.finished = [given, user_data](int status) {
        if (given.finished)
            given.finished(user_data, status);
    };
    QString error;
    if (!session->session.start(QString::fromUtf8(extension), session->items, std::move(wrapped), &error))
        return failed(session, error);
    session->error.clear();
    return 0;
}

int zafrel_host_session_fd(const zafrel_host_session *session)
{
    return session->session.isStarted() ? session->session.fd() : -1;
}

int zafrel_host_session_dispatch(zafrel_host_session *session)
{
    QString error;
    const int result = session->session.dispatch(&error);
    if (result < 0)
        failed(session, error);
    return result;
}

int zafrel_host_session_remove_view(zafrel_host_session *session)
{
    QString error;
    if (!session->session.removeView(&error))
        return failed(session, error);
    return 0;
}

int zafrel_host_session_run(zafrel_host_session *session)
{
    if (!session->session.isStarted())
        return failed(session, QStringLiteral("the extension session was not started"));
    bool removed = false;
    for (;;) {
        const int state = zafrel_host_session_dispatch(session);
        if (state < 0)
            return -1;
        if (session->answered && !removed) {
            removed = true;
            zafrel_host_session_remove_view(session);
        }
        if (state == 0)
            break;
        pollfd ready{session->session.fd(), POLLIN, 0};
        if (::poll(&ready, 1, -1) < 0 && errno != EINTR)
            return failed(session, QStringLiteral("cannot wait for the extension: %1").arg(QString::fromLocal8Bit(std::strerror(errno))));
    }
    return session->session.exitStatus();
}

const char *zafrel_host_session_error(const zafrel_host_session *session)
{
    return session->error.constData();
}

const char *zafrel_host_extension_path(void)
{
    static const QByteArray path = [] {
        const QString prefix = installPrefix();
        if (prefix.isEmpty())
            return QByteArray();
        const QString candidate = QDir(prefix).filePath(QLatin1String(zaf::install::kLibexecDir) + QLatin1Char('/') + QLatin1String(kExtensionName));
        const QFileInfo info(candidate);
        return info.isFile() && info.isExecutable() ? QFile::encodeName(candidate) : QByteArray();
    }();
    return path.isEmpty() ? nullptr : path.constData();
}

} // extern "C"
