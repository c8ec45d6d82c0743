// A bundle's compiled gettext catalogue (".mo"), as the string-table lookups read it.

#include "fuzz_support.h"

#include "platform/bundle/mo_catalog.h"

#include <cstddef>
#include <cstdint>

extern "C" int LLVMFuzzerInitialize(int *, char ***)
{
    zaf::fuzz::setUpOnce();
    return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const uint8_t *data, size_t size)
{
    const QByteArray bytes = QByteArray::fromRawData(reinterpret_cast<const char *>(data), qsizetype(size));
    const zaf::bundle::MoCatalog catalog = zaf::bundle::parseMoCatalog(bytes);
    // A catalogue is either read or refused with a reason, never half of each.
    ZAF_FUZZ_CHECK(catalog.isValid() || catalog.strings.isEmpty());
    ZAF_FUZZ_CHECK(catalog.isValid() || !catalog.error.isEmpty());
    // The header entry is no message.
    ZAF_FUZZ_CHECK(!catalog.strings.contains(QString()));
    // Every string came out of the file.
    qsizetype characters = 0;
    for (auto it = catalog.strings.cbegin(); it != catalog.strings.cend(); ++it)
        characters += it.key().size() + it.value().size();
    ZAF_FUZZ_CHECK(characters <= qsizetype(size) * 2);
    catalog.strings.value(QStringLiteral("Cancel"));
    return 0;
}
