#include "platform/error.h"

#include <cstring>

namespace zaf {

QString Error::description() const
{
    return QStringLiteral("Error Domain=%1 Code=%2 \"%3\"").arg(domain).arg(code).arg(message);
}

Error Error::fromErrno(int errnum, const QString &path)
{
    QString text = QString::fromLocal8Bit(std::strerror(errnum));
    if (!path.isEmpty())
        text += QStringLiteral(": ") + path;
    return Error{QString::fromLatin1(kPosixErrorDomain), errnum, text};
}

} // namespace zaf
