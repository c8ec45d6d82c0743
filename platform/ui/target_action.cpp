#include "platform/ui/target_action.h"
#include "platform/thread_rules.h"

#include <QMetaMethod>
#include <QMetaObject>

namespace zaf::ui {

namespace {

// The index of `name(QObject*)` or else `name()`, or -1.
int methodIndex(const QObject *target, const QByteArray &name, bool *takesSender)
{
    const QMetaObject *meta = target->metaObject();
    int index = meta->indexOfMethod(QMetaObject::normalizedSignature(name + "(QObject*)"));
    *takesSender = index >= 0;
    if (index < 0)
        index = meta->indexOfMethod(QMetaObject::normalizedSignature(name + "()"));
    return index;
}

} // namespace

bool TargetAction::targetRespondsToAction() const
{
    if (!m_target || m_action.isEmpty())
        return false;
    bool takesSender;
    return methodIndex(m_target, m_action, &takesSender) >= 0;
}

bool TargetAction::send(QObject *sender) const
{
    ZAF_ASSERT_MAIN_THREAD();
    if (!m_target || m_action.isEmpty())
        return false;
    bool takesSender;
    const int index = methodIndex(m_target, m_action, &takesSender);
    if (index < 0)
        return false;
    const QMetaMethod method = m_target->metaObject()->method(index);
    return takesSender ? method.invoke(m_target.data(), Qt::DirectConnection, Q_ARG(QObject *, sender))
                       : method.invoke(m_target.data(), Qt::DirectConnection);
}

} // namespace zaf::ui
