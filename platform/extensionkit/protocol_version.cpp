#include "platform/extensionkit/protocol_version.h"

namespace zaf::extensionkit {

namespace {

// A decimal number of 1 to 4 digits: no sign, no space, no leading '+'.
std::optional<int> parseNumber(QStringView text)
{
    if (text.isEmpty() || text.size() > 4)
        return std::nullopt;
    int value = 0;
    for (const QChar c : text) {
        if (c < QLatin1Char('0') || c > QLatin1Char('9'))
            return std::nullopt;
        value = value * 10 + (c.unicode() - '0');
    }
    return value;
}

} // namespace

QString ProtocolVersion::toString() const
{
    return QStringLiteral("%1.%2").arg(major).arg(minor);
}

std::optional<ProtocolVersion> parseProtocolVersion(const QString &text)
{
    const qsizetype dot = text.indexOf(QLatin1Char('.'));
    if (dot < 0)
        return std::nullopt;
    const std::optional<int> major = parseNumber(QStringView(text).left(dot));
    const std::optional<int> minor = parseNumber(QStringView(text).mid(dot + 1));
    if (!major || !minor)
        return std::nullopt;
    return ProtocolVersion{*major, *minor};
}

bool isCompatibleProtocolVersion(const ProtocolVersion &ours, const ProtocolVersion &theirs)
{
    return ours.major == theirs.major;
}

} // namespace zaf::extensionkit
