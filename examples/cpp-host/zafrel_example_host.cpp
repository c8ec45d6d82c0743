// A tiny host in C++: presents the Zafrel video editor on a recording with the zafrel-host library
// and prints what the user did, as one JSON array line per report.
//
//   zafrel_example_host --movie PATH --app-name NAME --bundle-id ID [--attachment PATH]
//                       [--share-message TEXT] [--tint #RRGGBB[AA]] [--extension PATH]
//
// The editor's save removes the movie it was handed, as it does for a recorder's fresh recording.
// Exit status: 0 after a report and a normal exit of the editor, 1 when the editor could not start,
// refused the request, died or ended without a report, 2 for bad arguments.
//
// Build it with the installed library alone (see the Makefile beside it):
//   c++ -o zafrel_example_host zafrel_example_host.cpp $(pkg-config --cflags --libs zafrel-host)
//
// It runs its own poll() loop, as a program with an event loop of its own would: the session's
// descriptor goes into the loop beside the program's others, and the session is dispatched
// whenever it is readable.

#include <zafrel/host.h>

#include <cerrno>
#include <cstdio>
#include <iostream>
#include <map>
#include <memory>
#include <string>

#include <poll.h>

namespace {

struct Run {
    zafrel_host_session *session = nullptr;
    int reports = 0;
    bool refused = false;
    int exitStatus = -1;
};

std::string jsonString(const std::string &text)
{
    std::string out = "\"";
    for (const unsigned char c : text) {
        if (c == '"' || c == '\\') {
            out += '\\';
            out += char(c);
        } else if (c < 0x20) {
            char escaped[8];
            std::snprintf(escaped, sizeof escaped, "\\u%04x", c);
            out += escaped;
        } else {
            out += char(c);
        }
    }
    return out + '"';
}

// The library's callbacks, each called from zafrel_host_session_dispatch() on this thread.
const zafrel_host_callbacks kCallbacks = {
    [](void *, const char *protocolVersion) {
        std::cerr << "zafrel_example_host: the editor is open (protocol " << protocolVersion << ")\n";
    },
    [](void *data, int code, const char *message) {
        auto *run = static_cast<Run *>(data);
        run->refused = true;
        std::cerr << "zafrel_example_host: the editor refused the recording: " << message << " (" << code << ")\n";
        zafrel_host_session_remove_view(run->session);
    },
    [](void *data, const char *const *activityTypes, size_t count) {
        auto *run = static_cast<Run *>(data);
        std::string line = "[";
        for (size_t i = 0; i < count; ++i)
            line += (i > 0 ? "," : "") + jsonString(activityTypes[i]);
        std::cout << line << "]" << std::endl;
        // The report is the user's result: the editor's view can go.
        if (run->reports++ == 0)
            zafrel_host_session_remove_view(run->session);
    },
    [](void *data, int exitStatus) { static_cast<Run *>(data)->exitStatus = exitStatus; },
};

int usage(const char *problem)
{
    std::cerr << "zafrel_example_host: " << problem << "\n"
              << "usage: zafrel_example_host --movie PATH --app-name NAME --bundle-id ID [--attachment PATH]\n"
                 "                           [--share-message TEXT] [--tint #RRGGBB[AA]] [--extension PATH]\n";
    return 2;
}

} // namespace

int main(int argc, char **argv)
{
    const std::map<std::string, const char *> itemOptions = {
        {"--movie", ZAFREL_HOST_MOVIE_KEY},
        {"--app-name", ZAFREL_HOST_APP_NAME_KEY},
        {"--bundle-id", ZAFREL_HOST_BUNDLE_IDENTIFIER_KEY},
        {"--attachment", ZAFREL_HOST_FILE_ATTACHMENT_KEY},
        {"--share-message", ZAFREL_HOST_SHARE_MESSAGE_KEY},
        {"--tint", ZAFREL_HOST_TINT_COLOR_KEY},
    };
    const std::unique_ptr<zafrel_host_session, decltype(&zafrel_host_session_free)> session(zafrel_host_session_new(),
                                                                                          &zafrel_host_session_free);
    if (!session)
        return 1;
    Run run;
    run.session = session.get();

    const char *extension = nullptr; // the one installed beside the library
    for (int i = 1; i < argc; i += 2) {
        if (i + 1 >= argc)
            return usage("every option takes a value");
        const std::string option = argv[i];
        if (option == "--extension") {
            extension = argv[i + 1];
            continue;
        }
        const auto key = itemOptions.find(option);
        if (key == itemOptions.end())
            return usage(("unknown option " + option).c_str());
        if (zafrel_host_session_add_item(run.session, key->second, argv[i + 1]) != 0) {
            std::cerr << "zafrel_example_host: " << zafrel_host_session_error(run.session) << "\n";
            return 2;
        }
    }

    if (zafrel_host_session_start(run.session, extension, &kCallbacks, &run) != 0) {
        std::cerr << "zafrel_example_host: " << zafrel_host_session_error(run.session) << "\n";
        return 1;
    }
    for (;;) {
        const int state = zafrel_host_session_dispatch(run.session);
        if (state < 0)
            std::cerr << "zafrel_example_host: " << zafrel_host_session_error(run.session) << "\n";
        if (state <= 0)
            break;
        pollfd ready{zafrel_host_session_fd(run.session), POLLIN, 0};
        if (poll(&ready, 1, -1) < 0 && errno != EINTR) {
            std::perror("zafrel_example_host: poll");
            break;
        }
    }
    if (run.reports == 0 && !run.refused)
        std::cerr << "zafrel_example_host: the editor ended without a report\n";
    return run.reports > 0 && !run.refused && run.exitStatus == 0 ? 0 : 1;
}
