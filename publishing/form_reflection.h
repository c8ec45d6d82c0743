#pragma once

// The publishing plug-in's form and agent, reached by name through the meta-object system. Every
// name is a constant of publishing_agent.h. A member the other side lacks (a property missing, a
// method renamed or gone, a call with other arguments) is logged in "zaf.publishing.activity",
// never passed over in silence, and whatever can still be done is done.
//
// Threads: main thread only (the form and the agent are widgets' owners).

#include <QMetaObject>
#include <QObject>
#include <QString>

#include <utility>

namespace zaf::publishing {

// Logs that `target` (or nothing, when null) does not answer `method`.
void logUnansweredCall(const QObject *target, const char *method);

// Calls `method` on `target` by name, with Q_ARG / Q_RETURN_ARG arguments. False, logged, when the
// call cannot be made.
template <typename... Arguments>
bool invokeByName(QObject *target, const char *method, Arguments &&...arguments)
{
    if (target && QMetaObject::invokeMethod(target, method, std::forward<Arguments>(arguments)...))
        return true;
    logUnansweredCall(target, method);
    return false;
}

// The object the form publishes as property `name`; null, logged, when it has none.
QObject *objectProperty(const QObject *form, const char *name);

// Puts `text` into the form's description cell (row 1 of section 0 of its table) and clears the
// cell's placeholder. A form without that cell keeps an empty description.
void fillDescriptionOfForm(QObject *form, const QString &text);

// Selects the first category whose id, lower-cased, is `categoryId`: the category cell shows its
// label, the form's default category becomes its id as stored, and the picker selects its row in
// component 0 without animation. A form without such a category is left as it is.
void selectCategoryOfForm(QObject *form, const QString &categoryId);

} // namespace zaf::publishing
