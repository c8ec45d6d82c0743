// zaf-identity ID: what the share text will say about the application with that identifier: its
// localized name from its desktop entry, its store record (from the software catalogue), and the
// share text built from them in the user's language.
#include "identity/bundle_extensions.h"
#include "identity/store_info.h"
#include "identity/store_manager.h"
#include "platform/log.h"
#include "platform/text/object_format.h"

#include <QCoreApplication>
#include <QJsonDocument>
#include <QJsonObject>

#include <cstdio>

int main(int argc, char **argv)
{
    QCoreApplication app(argc, argv);
    zaf::log::hideInformationalEntriesByDefault();
    const QStringList args = app.arguments().mid(1);
    if (args.size() != 1 || args.first().startsWith(QLatin1Char('-'))) {
        std::fprintf(stderr, "usage: zaf-identity BUNDLE_ID\n");
        return 2;
    }
    const QString identifier = args.first();
    const std::optional<QString> localName = ZafBundleExtensions::_zafLocalizedAppNameFromBundleID(identifier);
    std::printf("local name:  %s\n", localName ? qPrintable(*localName) : "(no desktop entry)");

    ZafStoreManager::sharedManager().loadItemDetailsForBundleIdentifier(identifier, [&](const ZafStoreInfo &info) {
        const QJsonObject record = QJsonObject::fromVariantMap(info.dictionary());
        std::printf("store record: %s\n", QJsonDocument(record).toJson(QJsonDocument::Compact).constData());
        // The share text: the format with the name and the author, or the name alone without an author.
        QString text = info.appName().value_or(QString());
        if (info.author() && !info.author()->isEmpty()) {
            const std::optional<QString> format =
                ZafBundleExtensions::_zafLocalizedStringFromFrameworkBundleWithKey(QStringLiteral("SHARE_TEXT_FORMAT"));
            if (format)
                text = zaf::text::formatWithObjects(*format, {info.appName().value_or(QString()), *info.author()});
        }
        std::printf("share text:  %s\n", qPrintable(text));
        app.quit();
    });
    return app.exec();
}
