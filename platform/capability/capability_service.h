#pragma once

// The capability service: integer and boolean answers about the device, by key.
//
// Answers come from built-in desktop defaults, overridden by a JSON object in the file named by the
// environment variable ZAF_CAPABILITIES_FILE (for tests and kiosks), for example
//   {"home-button-type": 2, "not-green-tea": false, "graphics-quality-level": 10, "device-idiom": 1}
// A missing or malformed file is logged and the defaults stand. Thread-safe; callable from any thread.

#include <QString>

#include <cstdint>
#include <optional>

namespace zaf {

namespace capability {
// 2 means the device has no home button (the tall toolbars); desktops answer 0.
inline constexpr const char *kHomeButtonType = "home-button-type";
// Whether publishing to the video service is allowed.
inline constexpr const char *kNotGreenTea = "not-green-tea";
// The device's graphics-quality level; 10 means only software rendering is available.
inline constexpr const char *kGraphicsQualityLevel = "graphics-quality-level";
// The user-interface idiom: -1 cannot tell, 0 phone, 1 tablet.
inline constexpr const char *kDeviceIdiom = "device-idiom";
} // namespace capability

enum class DeviceIdiom { Unspecified = -1, Phone = 0, Pad = 1 };

class CapabilityService {
public:
    // The process-wide service. The override file is read on first use.
    static CapabilityService &shared();

    // The 32-bit integer answer for a key, or defaultValue when the device has no answer.
    std::int32_t integerAnswer(const QString &key, std::int32_t defaultValue) const;
    // The boolean answer for a key, or defaultValue when the device has no answer.
    bool booleanAnswer(const QString &key, bool defaultValue) const;

    // The graphics-quality level (the answer for kGraphicsQualityLevel).
    std::int32_t graphicsQualityLevel() const;
    // Whether the device can tell its idiom, and the idiom.
    bool canTellDeviceIdiom() const;
    DeviceIdiom deviceIdiom() const;

    // Reads the override file again (tests change ZAF_CAPABILITIES_FILE between cases).
    void reload();

private:
    CapabilityService();
    struct State;
    State *m_state;
};

} // namespace zaf
