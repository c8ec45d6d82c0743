#include "publishing/plugin/signin/refresh_token_store.h"

#include "platform/log.h"
#include "platform/thread_rules.h"

#include <qt6keychain/keychain.h>

#include <QLoggingCategory>

namespace zaf::publishing {

namespace {

Q_LOGGING_CATEGORY(lcSignIn, "zaf.publishing.signin")

constexpr const char *kService = "Zafrel";

QString keyFor(const QString &clientId)
{
    return QStringLiteral("youtube-refresh-token:") + clientId;
}

OptionalError errorOf(const QKeychain::Job &job)
{
    if (job.error() == QKeychain::NoError || job.error() == QKeychain::EntryNotFound)
        return std::nullopt;
    return Error{QStringLiteral("QKeychain"), int(job.error()), job.errorString()};
}

} // namespace

void readRefreshToken(const QString &clientId, std::function<void(const QString &token)> completion)
{
    ZAF_ASSERT_MAIN_THREAD();
    auto *job = new QKeychain::ReadPasswordJob(QLatin1String(kService));
    job->setAutoDelete(true);
    job->setKey(keyFor(clientId));
    QObject::connect(job, &QKeychain::Job::finished, [completion = std::move(completion)](QKeychain::Job *finished) {
        auto *read = static_cast<QKeychain::ReadPasswordJob *>(finished);
        if (const OptionalError e = errorOf(*read))
            zaf::log::info(lcSignIn(), QStringLiteral("No stored sign-in: the secret store answered %1").arg(e->description()));
        completion(read->error() == QKeychain::NoError ? read->textData() : QString());
    });
    job->start();
}

void storeRefreshToken(const QString &clientId, const QString &token, std::function<void(OptionalError)> completion)
{
    ZAF_ASSERT_MAIN_THREAD();
    auto *job = new QKeychain::WritePasswordJob(QLatin1String(kService));
    job->setAutoDelete(true);
    job->setKey(keyFor(clientId));
    job->setTextData(token);
    QObject::connect(job, &QKeychain::Job::finished, [completion = std::move(completion)](QKeychain::Job *finished) {
        const OptionalError e = errorOf(*finished);
        if (e)
            zaf::log::error(lcSignIn(), QStringLiteral("The sign-in is not kept for next time: %1").arg(e->description()));
        if (completion)
            completion(e);
    });
    job->start();
}

void forgetRefreshToken(const QString &clientId, std::function<void(OptionalError)> completion)
{
    ZAF_ASSERT_MAIN_THREAD();
    auto *job = new QKeychain::DeletePasswordJob(QLatin1String(kService));
    job->setAutoDelete(true);
    job->setKey(keyFor(clientId));
    QObject::connect(job, &QKeychain::Job::finished, [completion = std::move(completion)](QKeychain::Job *finished) {
        if (completion)
            completion(errorOf(*finished));
    });
    job->start();
}

} // namespace zaf::publishing
