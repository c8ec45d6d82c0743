#pragma once

#include <QString>
#include <QStringList>

namespace zaf::text {

// Fills a format with object arguments: "%@" takes the next argument, "%N$@" the Nth (1-based, so
// translations can reorder them), "%%" is a percent sign. A placeholder without an argument is
// left out; any other text is kept as it is.
QString formatWithObjects(const QString &format, const QStringList &arguments);

} // namespace zaf::text
