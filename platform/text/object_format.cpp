#include "platform/text/object_format.h"

namespace zaf::text {

QString formatWithObjects(const QString &format, const QStringList &arguments)
{
    QString out;
    out.reserve(format.size());
    qsizetype next = 0;
    for (qsizetype i = 0; i < format.size(); ++i) {
        const QChar c = format.at(i);
        if (c != QLatin1Char('%') || i + 1 >= format.size()) {
            out.append(c);
            continue;
        }
        const QChar n = format.at(i + 1);
        if (n == QLatin1Char('%')) {
            out.append(QLatin1Char('%'));
            ++i;
        } else if (n == QLatin1Char('@')) {
            if (next < arguments.size())
                out.append(arguments.at(next));
            ++next;
            ++i;
        } else if (n.isDigit()) {
            qsizetype j = i + 1;
            int position = 0;
            while (j < format.size() && format.at(j).isDigit() && position < 1000)
                position = position * 10 + format.at(j++).digitValue();
            if (j + 1 < format.size() && format.at(j) == QLatin1Char('$') && format.at(j + 1) == QLatin1Char('@')) {
                if (position >= 1 && position <= arguments.size())
                    out.append(arguments.at(position - 1));
                i = j + 1;
            } else {
                out.append(c);
            }
        } else {
            out.append(c);
        }
    }
    return out;
}

} // namespace zaf::text
