#include "publishing/form_reflection.h"

#include "platform/log.h"
#include "publishing/publishing_agent.h"

#include <QLoggingCategory>
#include <QVariantList>
#include <QVariantMap>

namespace zaf::publishing {

namespace {
Q_LOGGING_CATEGORY(lcFormReflection, "zaf.publishing.activity")
} // namespace

void logUnansweredCall(const QObject *target, const char *method)
{
    zaf::log::error(lcFormReflection(), QStringLiteral("the publishing form does not answer %1 on %2")
                                            .arg(QString::fromLatin1(method),
                                                 target ? QString::fromLatin1(target->metaObject()->className()) : QStringLiteral("nothing")));
}

QObject *objectProperty(const QObject *form, const char *name)
{
    QObject *object = form->property(name).value<QObject *>();
    if (!object)
        zaf::log::error(lcFormReflection(), QStringLiteral("the publishing form has no %1").arg(QString::fromLatin1(name)));
    return object;
}

void fillDescriptionOfForm(QObject *form, const QString &text)
{
    QObject *table = objectProperty(form, kZafFormTableProperty);
    QObject *cell = nullptr;
    if (!table || !invokeByName(table, kZafTableCellMethod, Q_RETURN_ARG(QObject *, cell), Q_ARG(int, 1), Q_ARG(int, 0)) || !cell)
        return;
    invokeByName(cell, kZafCellSetValueMethod, Q_ARG(QString, text));
    invokeByName(cell, kZafCellSetPlaceholderMethod, Q_ARG(QString, QString()));
}

void selectCategoryOfForm(QObject *form, const QString &categoryId)
{
    const QVariantList categories = form->property(kZafFormCategoriesProperty).toList();
    if (categories.isEmpty()) {
        zaf::log::error(lcFormReflection(), QStringLiteral("the publishing form lists no categories"));
        return;
    }
    QObject *picker = objectProperty(form, kZafFormPickerProperty);
    for (int row = 0; row < categories.size(); ++row) {
        const QVariantMap entry = categories.at(row).toMap();
        const QString id = entry.value(QLatin1String(kZafPublishingCategoryIdKey)).toString();
        if (id.toLower() != categoryId)
            continue;
        const QString label = entry.value(QLatin1String(kZafPublishingCategoryLabelKey)).toString();
        QObject *cell = nullptr;
        if (invokeByName(form, kZafFormCategoryCellMethod, Q_RETURN_ARG(QObject *, cell)) && cell)
            invokeByName(cell, kZafCategoryCellSetLabelMethod, Q_ARG(QString, label));
        form->setProperty(kZafFormDefaultCategoryProperty, id);
        if (picker)
            invokeByName(picker, kZafPickerSelectRowMethod, Q_ARG(int, row), Q_ARG(int, 0), Q_ARG(bool, false));
        return;
    }
}

} // namespace zaf::publishing
