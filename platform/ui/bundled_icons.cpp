#include "platform/ui/bundled_icons.h"

#include <QFile>

#include <mutex>

// The icons are compiled into this static library: registering them explicitly keeps the linker
// from dropping them. A global-namespace function, as the registration routine is a global symbol.
static void registerIconResources()
{
    static std::once_flag once;
    std::call_once(once, [] { Q_INIT_RESOURCE(ui_icons); });
}

namespace zaf::ui {

QIcon bundledIcon(const char *name)
{
    registerIconResources();
    const QString path = QStringLiteral(":/zaf/ui/icons/%1.svg").arg(QString::fromLatin1(name));
    return QFile::exists(path) ? QIcon(path) : QIcon();
}

} // namespace zaf::ui
