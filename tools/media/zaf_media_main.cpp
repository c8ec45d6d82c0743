// zaf-media: the editor's media engine on the command line.
//
//   zaf-media probe FILE
//   zaf-media trim IN OUT --start S --end E
//   zaf-media mix IN [OUT]
//   zaf-media thumbnails IN --count N --height H --out DIR
#include "platform/log.h"
#include "tools/media/commands.h"

#include <QCoreApplication>

#include <cstdio>

namespace zaf::tools {

int fail(const QString &message)
{
    std::fprintf(stderr, "zaf-media: %s\n", qPrintable(message));
    return 1;
}

} // namespace zaf::tools

int main(int argc, char **argv)
{
    QCoreApplication app(argc, argv);
    zaf::log::hideInformationalEntriesByDefault();
    QStringList args = app.arguments().mid(1);
    const QString command = args.isEmpty() ? QString() : args.takeFirst();
    if (command == QLatin1String("probe"))
        return zaf::tools::probeCommand(args);
    if (command == QLatin1String("trim"))
        return zaf::tools::trimCommand(args);
    if (command == QLatin1String("mix"))
        return zaf::tools::mixCommand(args);
    if (command == QLatin1String("thumbnails"))
        return zaf::tools::thumbnailsCommand(args);
    std::fprintf(stderr, "usage: zaf-media probe FILE\n"
                         "       zaf-media trim IN OUT --start SECONDS --end SECONDS\n"
                         "       zaf-media mix IN [OUT]\n"
                         "       zaf-media thumbnails IN --count N --height H --out DIR\n");
    return 2;
}
