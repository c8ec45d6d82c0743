#pragma once

// Points the capability service at a file with these answers (no file when null) for the life of
// the object, then back at the defaults.

#include "platform/capability/capability_service.h"
#include "tests/support/temp_dir.h"

#include <QFile>

namespace zaf::test {

class ScopedCapabilities {
public:
    explicit ScopedCapabilities(const QByteArray &json)
    {
        qunsetenv("ZAF_CAPABILITIES_FILE");
        if (!json.isNull()) {
            QFile file(m_scratch.file(QStringLiteral("capabilities.json")));
            if (file.open(QIODevice::WriteOnly) && file.write(json) == json.size())
                qputenv("ZAF_CAPABILITIES_FILE", QFile::encodeName(file.fileName()));
        }
        CapabilityService::shared().reload();
    }
    ~ScopedCapabilities()
    {
        qunsetenv("ZAF_CAPABILITIES_FILE");
        CapabilityService::shared().reload();
    }

private:
    ScratchDir m_scratch;
};

} // namespace zaf::test
