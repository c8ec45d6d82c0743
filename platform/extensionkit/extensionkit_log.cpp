#include "platform/extensionkit/extensionkit_log.h"

namespace zaf::extensionkit {
Q_LOGGING_CATEGORY(lcExtensionKit, "zaf.extensionkit")
} // namespace zaf::extensionkit
