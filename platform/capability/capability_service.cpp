#include "platform/capability/capability_service.h"

#include "platform/log.h"

#include <QDir>
#include <QFile>
#include <QJsonDocument>
#include <QJsonObject>
#include <QVariant>

#include <mutex>

Q_LOGGING_CATEGORY(lcCapability, "zaf.capability")

namespace zaf {

namespace {

// Hardware rendering is available when the kernel exposes a render node and nobody forces software.
bool hasHardwareRendering()
{
    if (qEnvironmentVariableIntValue("LIBGL_ALWAYS_SOFTWARE") != 0)
        return false;
    const QString platform = qEnvironmentVariable("QT_QPA_PLATFORM");
    if (platform == QLatin1String("offscreen") || platform == QLatin1String("minimal"))
        return false;
    return !QDir(QStringLiteral("/dev/dri")).entryList({QStringLiteral("renderD*")}, QDir::System).isEmpty();
}

QJsonObject desktopDefaults()
{
    QJsonObject o;
    o.insert(QLatin1String(capability::kHomeButtonType), 0);
    o.insert(QLatin1String(capability::kNotGreenTea), true);
    o.insert(QLatin1String(capability::kGraphicsQualityLevel), hasHardwareRendering() ? 100 : 10);
    o.insert(QLatin1String(capability::kDeviceIdiom), int(DeviceIdiom::Unspecified));
    return o;
}

QJsonObject readOverrides()
{
    const QString path = qEnvironmentVariable("ZAF_CAPABILITIES_FILE");
    if (path.isEmpty())
        return {};
    QFile file(path);
    if (!file.open(QIODevice::ReadOnly)) {
        log::error(lcCapability(), QStringLiteral("cannot read capability file %1: %2").arg(path, file.errorString()));
        return {};
    }
    QJsonParseError parseError;
    const QJsonDocument doc = QJsonDocument::fromJson(file.read(1 << 20), &parseError);
    if (!doc.isObject()) {
        log::error(lcCapability(), QStringLiteral("capability file %1 is not a JSON object: %2")
                                       .arg(path, parseError.errorString()));
        return {};
    }
    return doc.object();
}

} // namespace

struct CapabilityService::State {
    mutable std::mutex mutex;
    QJsonObject answers;
};

CapabilityService::CapabilityService()
    : m_state(new State)
{
    reload();
}

CapabilityService &CapabilityService::shared()
{
    static CapabilityService service;
    return service;
}

void CapabilityService::reload()
{
    QJsonObject answers = desktopDefaults();
    const QJsonObject overrides = readOverrides();
    for (auto it = overrides.begin(); it != overrides.end(); ++it)
        answers.insert(it.key(), it.value());
    std::lock_guard lock(m_state->mutex);
    m_state->answers = answers;
}

std::int32_t CapabilityService::integerAnswer(const QString &key, std::int32_t defaultValue) const
{
    std::lock_guard lock(m_state->mutex);
    const QJsonValue v = m_state->answers.value(key);
    if (v.isDouble())
        return std::int32_t(v.toDouble());
    if (v.isBool())
        return v.toBool() ? 1 : 0;
    return defaultValue;
}

bool CapabilityService::booleanAnswer(const QString &key, bool defaultValue) const
{
    std::lock_guard lock(m_state->mutex);
    const QJsonValue v = m_state->answers.value(key);
    if (v.isBool())
        return v.toBool();
    if (v.isDouble())
        return v.toDouble() != 0;
    return defaultValue;
}

std::int32_t CapabilityService::graphicsQualityLevel() const
{
    return integerAnswer(QLatin1String(capability::kGraphicsQualityLevel), 100);
}

bool CapabilityService::canTellDeviceIdiom() const
{
    return deviceIdiom() != DeviceIdiom::Unspecified;
}

DeviceIdiom CapabilityService::deviceIdiom() const
{
    switch (integerAnswer(QLatin1String(capability::kDeviceIdiom), -1)) {
    case 0:
        return DeviceIdiom::Phone;
    case 1:
        return DeviceIdiom::Pad;
    default:
        return DeviceIdiom::Unspecified;
    }
}

} // namespace zaf
