// A desktop entry's contents, read as the application bundle of the host ("NAME.desktop") and as a
// directory bundle's information dictionary ("Info.desktop"), followed by the name lookups the app
// does: the localized DisplayName for the user's languages, then the plain DisplayName and BundleName.

#include "fuzz_support.h"

#include "platform/bundle/bundle.h"

#include <QDir>
#include <QFile>
#include <QTemporaryDir>

#include <cstddef>
#include <cstdint>
#include <memory>

namespace {

// The two places the bytes are written to; created once and removed at exit.
struct Paths {
    QTemporaryDir root;
    QString applicationEntry;
    QString bundleDirectory;
    QString infoEntry;

    Paths()
    {
        QDir(root.path()).mkpath(QStringLiteral("applications"));
        QDir(root.path()).mkpath(QStringLiteral("Fuzz.bundle"));
        applicationEntry = root.filePath(QStringLiteral("applications/org.example.Fuzz.desktop"));
        bundleDirectory = root.filePath(QStringLiteral("Fuzz.bundle"));
        infoEntry = bundleDirectory + QStringLiteral("/Info.desktop");
    }
};

Paths &paths()
{
    static Paths instance;
    return instance;
}

bool writeFile(const QString &path, const uint8_t *data, size_t size)
{
    QFile file(path);
    if (!file.open(QIODevice::WriteOnly | QIODevice::Truncate))
        return false;
    return file.write(reinterpret_cast<const char *>(data), qint64(size)) == qint64(size);
}

void lookUpNames(const std::shared_ptr<zaf::bundle::Bundle> &bundle)
{
    if (!bundle)
        return;
    const QVariantMap localized = bundle->localizedInfoDictionary();
    const QVariantMap info = bundle->infoDictionary();
    // A localized name is only ever a translation of a name the entry has.
    ZAF_FUZZ_CHECK(localized.isEmpty() || localized.keys() == QStringList{QString::fromLatin1(zaf::bundle::kDisplayNameKey)});
    info.value(QString::fromLatin1(zaf::bundle::kDisplayNameKey)).toString();
    info.value(QString::fromLatin1(zaf::bundle::kBundleNameKey)).toString();
    bundle->bundleIdentifier();
}

} // namespace

extern "C" int LLVMFuzzerInitialize(int *, char ***)
{
    zaf::fuzz::setUpOnce();
    // Languages with a region, a script (a desktop-entry modifier) and a bare language, so every
    // fallback step of the Name[...] lookup is taken.
    zaf::bundle::setPreferredLanguagesForTesting(
        {QStringLiteral("sr-Latn-RS"), QStringLiteral("de-CH"), QStringLiteral("pt-BR"), QStringLiteral("fr"), QStringLiteral("en")});
    ZAF_FUZZ_CHECK(paths().root.isValid());
    return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const uint8_t *data, size_t size)
{
    if (writeFile(paths().applicationEntry, data, size))
        lookUpNames(zaf::bundle::Bundle::bundleWithPath(paths().applicationEntry));
    if (writeFile(paths().infoEntry, data, size))
        lookUpNames(zaf::bundle::Bundle::bundleWithPath(paths().bundleDirectory));
    return 0;
}
