#pragma once

// The logging category of the host side: "zaf.host".

#include <QLoggingCategory>

Q_DECLARE_LOGGING_CATEGORY(lcHost)
