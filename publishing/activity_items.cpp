#include "publishing/activity_items.h"

#include <QMetaType>

namespace zaf::publishing {

namespace {

bool isString(const QVariant &item)
{
    return item.typeId() == QMetaType::QString;
}

} // namespace

QString descriptionForItems(const QVariantList &activityItems)
{
    const bool textFirst = !activityItems.isEmpty() && isString(activityItems.at(0));
    const bool textSecond = activityItems.size() > 1 && isString(activityItems.at(1));
    if (textFirst && textSecond)
        return activityItems.at(0).toString() + QLatin1Char(' ') + activityItems.at(1).toString();
    if (textFirst)
        return activityItems.at(0).toString();
    if (textSecond)
        return activityItems.at(1).toString();
    return {};
}

QUrl movieCandidateInItems(const QVariantList &activityItems)
{
    for (const QVariant &item : activityItems) {
        if (item.typeId() == QMetaType::QUrl && item.toUrl().isLocalFile())
            return item.toUrl();
    }
    return {};
}

} // namespace zaf::publishing
