#include "host/host_log.h"

Q_LOGGING_CATEGORY(lcHost, "zaf.host")
