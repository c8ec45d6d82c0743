#include "identity/bundle_extensions.h"

#include "platform/install_layout.h"

#include <QDir>
#include <QFileInfo>

#include <mutex>

using zaf::bundle::Bundle;

namespace {

constexpr const char *kLocalizableTable = "Localizable";

QString frameworkBundlePath()
{
    return zaf::install::dataPath("ZAF_FRAMEWORK_BUNDLE_PATH", QLatin1String(zaf::install::kStringTablesDir) + QStringLiteral("/Zafrel"),
                                  QStringLiteral(ZAF_FRAMEWORK_BUNDLE_DIR));
}

QString stringValue(const QVariantMap &dictionary, const char *key)
{
    const QVariant v = dictionary.value(QLatin1String(key));
    return v.isValid() ? v.toString() : QString();
}

} // namespace

QString ZafBundleExtensions::_zafLocalizedAppName(const Bundle &bundle)
{
    QString name = stringValue(bundle.localizedInfoDictionary(), zaf::bundle::kDisplayNameKey);
    if (name.isNull())
        name = stringValue(bundle.infoDictionary(), zaf::bundle::kDisplayNameKey);
    if (name.isNull())
        name = stringValue(bundle.infoDictionary(), zaf::bundle::kBundleNameKey);
    return name.isNull() ? QStringLiteral("") : name;
}

std::shared_ptr<Bundle> ZafBundleExtensions::_zafFrameworkBundle()
{
    static std::shared_ptr<Bundle> bundle;
    static std::once_flag once;
    std::call_once(once, [] { bundle = Bundle::bundleWithPath(frameworkBundlePath()); });
    return bundle;
}

std::optional<QString> ZafBundleExtensions::_zafLocalizedAppNameFromBundleID(const QString &bundleIdentifier)
{
    const std::shared_ptr<Bundle> bundle = Bundle::bundleWithIdentifier(bundleIdentifier);
    if (!bundle)
        return std::nullopt;
    return _zafLocalizedAppName(*bundle);
}

std::shared_ptr<Bundle> ZafBundleExtensions::localizedBundle()
{
    const std::shared_ptr<Bundle> framework = _zafFrameworkBundle();
    if (!framework)
        return nullptr;
    const QStringList order =
        zaf::bundle::preferredLocalizationsFromArray(framework->localizations(), zaf::bundle::preferredLanguages());
    if (order.isEmpty())
        return nullptr;
    return Bundle::bundleWithPath(QDir(framework->resourcePath()).filePath(order.first() + QStringLiteral(".lproj")));
}

std::shared_ptr<Bundle> ZafBundleExtensions::fallbackBundle()
{
    const std::shared_ptr<Bundle> framework = _zafFrameworkBundle();
    const QStringList languages = zaf::bundle::preferredLanguages();
    if (!framework || languages.isEmpty())
        return nullptr;
    const QString primary = languages.first().split(QLatin1Char('-')).first();
    const QString table = framework->pathForResource(QLatin1String(kLocalizableTable), QStringLiteral("mo"), primary);
    if (table.isEmpty())
        return nullptr;
    return Bundle::bundleWithPath(QFileInfo(table).absolutePath());
}

std::optional<QString> ZafBundleExtensions::_zafLocalizedStringFromFrameworkBundleWithKey(const QString &key)
{
    // An existing bundle always answers, so the chain moves on only past missing bundles.
    for (const std::shared_ptr<Bundle> &bundle : {localizedBundle(), fallbackBundle(), _zafFrameworkBundle()}) {
        if (bundle)
            return bundle->localizedStringForKey(key, QString(), QLatin1String(kLocalizableTable));
    }
    return std::nullopt;
}

QString ZafBundleExtensions::baseIdentifier(const QString &identifier)
{
    QStringList pieces = identifier.split(QLatin1Char('.'));
    pieces.removeLast();
    return pieces.join(QLatin1Char('.'));
}

std::shared_ptr<Bundle> ZafBundleExtensions::bundleWithPID(pid_t pid)
{
    QString path;
    if (zaf::bundle::executablePathOfProcess(pid, &path) <= 0 || path.isEmpty())
        return nullptr;
    return Bundle::bundleForExecutablePath(path);
}
