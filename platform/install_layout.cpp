#include "platform/install_layout.h"

#include <QDir>
#include <QFileInfo>

namespace zaf::install {

QString installPrefixOf(const QString &executablePath)
{
    const QFileInfo executable(executablePath);
    if (executablePath.isEmpty() || !executable.exists())
        return {};
    QDir dir = executable.canonicalFilePath().isEmpty() ? executable.absoluteDir() : QFileInfo(executable.canonicalFilePath()).absoluteDir();
    const QString path = dir.absolutePath();
    const QString libexec = QStringLiteral("/") + QLatin1String(kLibexecDir);
    QString prefix;
    if (path.endsWith(QStringLiteral("/bin")))
        prefix = path.left(path.size() - 4);
    else if (path.endsWith(libexec))
        prefix = path.left(path.size() - libexec.size());
    else
        return {};
    // Only a prefix that holds our data is ours: a build tree's bin/ folder is not.
    if (!QFileInfo(QDir(prefix.isEmpty() ? QStringLiteral("/") : prefix).filePath(QLatin1String(kStringTablesDir))).isDir())
        return {};
    return prefix.isEmpty() ? QStringLiteral("/") : prefix;
}

QString installPrefix()
{
    static const QString prefix = installPrefixOf(QFileInfo(QStringLiteral("/proc/self/exe")).symLinkTarget());
    return prefix;
}

QString dataPath(const char *overrideVariable, const QString &relativePath, const QString &buildTreePath)
{
    const QString overridden = qEnvironmentVariable(overrideVariable);
    if (!overridden.isEmpty())
        return overridden;
    const QString prefix = installPrefix();
    return prefix.isEmpty() ? buildTreePath : QDir(prefix).filePath(relativePath);
}

} // namespace zaf::install
