#pragma once

// The logging category of the extension runtime: "zaf.extensionkit".

#include <QLoggingCategory>

namespace zaf::extensionkit {
Q_DECLARE_LOGGING_CATEGORY(lcExtensionKit)
} // namespace zaf::extensionkit
