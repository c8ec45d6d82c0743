#include "platform/bundle/localization_matching.h"

#include "platform/log.h"

#include <QList>
#include <QLocale>
#include <QLoggingCategory>

#include <unicode/localematcher.h>
#include <unicode/locid.h>

#include <mutex>

namespace zaf::bundle {

namespace {

Q_LOGGING_CATEGORY(lcLocalization, "zaf.bundle")

std::mutex g_preferencesMutex;
QStringList g_preferencesOverride;

// An ICU locale for a localization or preference name; "bogus" when it is not a language tag.
icu::Locale icuLocale(const QString &name)
{
    QString tag = name;
    tag.replace(QLatin1Char('_'), QLatin1Char('-'));
    UErrorCode status = U_ZERO_ERROR;
    icu::Locale locale = icu::Locale::forLanguageTag(tag.toStdString(), status);
    if (U_FAILURE(status) || locale.isBogus() || locale.getLanguage()[0] == '\0')
        locale.setToBogus();
    return locale;
}

} // namespace

QStringList preferredLanguages()
{
    {
        std::lock_guard lock(g_preferencesMutex);
        if (!g_preferencesOverride.isEmpty())
            return g_preferencesOverride;
    }
    QStringList languages;
    for (QString language : QLocale::system().uiLanguages()) {
        // The C (POSIX) locale asks for the untranslated messages, and those are written in English.
        if (language == QLatin1String("C") || language == QLatin1String("POSIX"))
            language = QString::fromLatin1(kDevelopmentLocalization);
        language.replace(QLatin1Char('_'), QLatin1Char('-'));
        if (!languages.contains(language))
            languages << language;
    }
    return languages;
}

void setPreferredLanguagesForTesting(const QStringList &languages)
{
    std::lock_guard lock(g_preferencesMutex);
    g_preferencesOverride = languages;
}

QStringList preferredLocalizationsFromArray(const QStringList &localizations, const QStringList &preferences)
{
    QStringList remaining = localizations;
    remaining.removeDuplicates();
    QStringList ordered;
    for (const QString &preference : preferences) {
        const icu::Locale desired = icuLocale(preference);
        if (desired.isBogus())
            continue;
        // Take every localization that serves this preference, best first; the matcher breaks ties
        // by the order of the supported list, which is the given order.
        while (!remaining.isEmpty()) {
            icu::LocaleMatcher::Builder builder;
            QList<qsizetype> indexOf; // supported index -> index into `remaining`
            for (qsizetype i = 0; i < remaining.size(); ++i) {
                const icu::Locale supported = icuLocale(remaining[i]);
                if (supported.isBogus())
                    continue;
                builder.addSupportedLocale(supported);
                indexOf << i;
            }
            if (indexOf.isEmpty())
                break;
            builder.setNoDefaultLocale();
            UErrorCode status = U_ZERO_ERROR;
            const icu::LocaleMatcher matcher = builder.build(status);
            if (U_FAILURE(status)) {
                zaf::log::error(lcLocalization(), QStringLiteral("Locale matcher cannot be built: %1").arg(QString::fromLatin1(u_errorName(status))));
                break;
            }
            const icu::LocaleMatcher::Result result = matcher.getBestMatchResult(desired, status);
            if (U_FAILURE(status) || result.getSupportedIndex() < 0)
                break;
            const qsizetype index = indexOf.at(result.getSupportedIndex());
            ordered << remaining.takeAt(index);
        }
    }
    // The texts are written in the development language: when no preference is served, it is the
    // best remaining choice, ahead of the other localizations in their given order.
    for (qsizetype i = 0; i < remaining.size(); ++i) {
        if (remaining[i] == QLatin1String(kDevelopmentLocalization)) {
            remaining.move(i, 0);
            break;
        }
    }
    return ordered + remaining;
}

} // namespace zaf::bundle
