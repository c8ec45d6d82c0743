#include "identity/user_error.h"

namespace {

QString defaultDescription(int code)
{
    switch (code) {
    case ZafUserErrorCodeExportFailed:
        return QStringLiteral("The movie could not be exported.");
    case ZafUserErrorCodeNoMovie:
        return QStringLiteral("No movie was given.");
    default:
        return QStringLiteral("The recording operation failed (%1).").arg(code);
    }
}

} // namespace

zaf::Error ZafUserError::_zafUserErrorForCode(int code, const QVariantMap &userInfo)
{
    const QString description = userInfo.value(QStringLiteral("description")).toString();
    return zaf::Error{QString::fromLatin1(ZafUserErrorDomain), code,
                      description.isEmpty() ? defaultDescription(code) : description};
}
