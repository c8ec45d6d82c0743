// The .mo reader: msgfmt output in both byte orders, and corrupt catalogues that must give an error.
#include "platform/bundle/mo_catalog.h"
#include "tests/platform/bundle/bundle_fixtures.h"
#include "tests/support/named_cases.h"

#include <QFile>
#include <QTemporaryDir>
#include <QtEndian>
#include <gtest/gtest.h>

#include <functional>

namespace zaf::bundle {
namespace {

ZAF_PRINT_CASES_AS_NAMES
using test::ByteOrder;

const char *const kRichPo = R"(msgid ""
msgstr ""
"Project-Id-Version: fixture\n"
"Content-Type: text/plain; charset=UTF-8\n"
"Plural-Forms: nplurals=2; plural=(n != 1);\n"

msgid "Hello"
msgstr "Hallo"

msgid "SHARE_TEXT_FORMAT"
msgstr "Geteilt mit %@ \"Zitat\""

msgctxt "menu"
msgid "Open"
msgstr "Öffnen"

msgid "Open"
msgstr "Aufmachen"

msgid "%d file"
msgid_plural "%d files"
msgstr[0] "%d Datei"
msgstr[1] "%d Dateien"

msgid "Untranslated"
msgstr ""
)";

class MoByteOrderTest : public ::testing::TestWithParam<ByteOrder> {};

// Contexts are keyed "context\x04id", plurals by their singular form, and the header and
// untranslated entries are no messages.
TEST_P(MoByteOrderTest, ParsesMsgfmtOutput)
{
    const MoCatalog catalog = parseMoCatalog(test::compilePo(kRichPo, GetParam()));
    ASSERT_TRUE(catalog.isValid()) << catalog.error.toStdString();
    EXPECT_EQ(catalog.strings, (QHash<QString, QString>{{QStringLiteral("Hello"), QStringLiteral("Hallo")},
                                                    {QStringLiteral("SHARE_TEXT_FORMAT"), QStringLiteral("Geteilt mit %@ \"Zitat\"")},
                                                    {QStringLiteral("Open"), QStringLiteral("Aufmachen")},
                                                    {QStringLiteral("menu\x04Open"), QStringLiteral("Öffnen")},
                                                    {QStringLiteral("%d file"), QStringLiteral("%d Datei")}}));
}

INSTANTIATE_TEST_SUITE_P(ByteOrders, MoByteOrderTest, ::testing::Values(ByteOrder::Little, ByteOrder::Big),
                         [](const auto &info) { return info.param == ByteOrder::Big ? "BigEndian" : "LittleEndian"; });

// A plural entry whose singular is empty ("\0PLURAL") is no message, like the header: the lookup of
// an empty key finds nothing.
TEST(MoCatalogTest, APluralEntryWithAnEmptySingularIsNoMessage)
{
    QByteArray data = test::compilePo(kRichPo);
    const qsizetype plural = data.indexOf(QByteArrayView("%d file\0%d files", 16));
    ASSERT_GT(plural, 0);
    data[plural] = '\0';
    const MoCatalog catalog = parseMoCatalog(data);
    ASSERT_TRUE(catalog.isValid()) << catalog.error.toStdString();
    EXPECT_FALSE(catalog.strings.contains(QString()));
    EXPECT_EQ(catalog.strings.size(), 4);
}

TEST(MoCatalogTest, DecodesStringsInTheHeadersLatin1Charset)
{
    const QByteArray po = QByteArrayLiteral("msgid \"\"\nmsgstr \"Content-Type: text/plain; charset=ISO-8859-1\\n\"\n\n"
                                            "msgid \"Greeting\"\nmsgstr \"Gr\xfc\xdf" "e\"\n");
    const QByteArray data = test::compilePo(po);
    ASSERT_TRUE(data.contains("Gr\xfc\xdf" "e")) << "msgfmt keeps the catalogue in Latin-1";
    const MoCatalog catalog = parseMoCatalog(data);
    ASSERT_TRUE(catalog.isValid()) << catalog.error.toStdString();
    EXPECT_EQ(catalog.strings.value(QStringLiteral("Greeting")), QStringLiteral("Grüße"));
}

struct UnreadableFile {
    const char *name;
    std::function<void(const QString &path)> make; // nothing for a missing file
    QStringList inError;
};

class UnreadableMoFileTest : public ::testing::TestWithParam<UnreadableFile> {};

// A missing, corrupt or too large (over 16 MiB) file gives an error naming it, and no strings.
TEST_P(UnreadableMoFileTest, GivesAnErrorNamingTheFile)
{
    QTemporaryDir dir;
    const QString path = dir.filePath(QStringLiteral("table.mo"));
    if (GetParam().make)
        GetParam().make(path);
    const MoCatalog catalog = readMoCatalog(path);
    EXPECT_FALSE(catalog.isValid());
    EXPECT_TRUE(catalog.strings.isEmpty());
    for (const QString &part : GetParam().inError + QStringList{QStringLiteral("table.mo")})
        EXPECT_TRUE(catalog.error.contains(part)) << catalog.error.toStdString();
}

INSTANTIATE_TEST_SUITE_P(Files, UnreadableMoFileTest, ::testing::Values(
    UnreadableFile{"Missing", nullptr, {}},
    UnreadableFile{"Corrupt", [](const QString &path) { test::writeFile(path, QByteArray(64, 'x')); }, {"magic"}},
    // A valid catalogue followed by a sparse tail past the limit.
    UnreadableFile{"TooLarge", [](const QString &path) {
        test::writeFile(path, test::compilePo(test::poSource({{QStringLiteral("a"), QStringLiteral("b")}})));
        QFile huge(path);
        ASSERT_TRUE(huge.open(QIODevice::ReadWrite) && huge.resize(kMaxMoFileSize + 1));
    }, {"exceeds"}}), zaf::test::caseName);

// By the parser too.
TEST(MoCatalogTest, ParsingRefusesMoreThanTheLimit)
{
    EXPECT_FALSE(parseMoCatalog(QByteArray(kMaxMoFileSize + 1, '\0')).isValid());
}

// The layout of a little-endian msgfmt catalogue, read independently of the reader.
struct Layout {
    QByteArray data;
    quint32 word(qint64 at) const { return qFromLittleEndian<quint32>(data.constData() + at); }
    quint32 count() const { return word(8); }
    quint32 originals() const { return word(12); }
    quint32 translations() const { return word(16); }
    // Length and offset of original string i.
    quint32 originalLength(quint32 i) const { return word(originals() + 8 * i); }
    quint32 originalOffset(quint32 i) const { return word(originals() + 8 * i + 4); }
};

void putWord(QByteArray &data, qint64 at, quint32 value)
{
    qToLittleEndian<quint32>(value, data.data() + at);
}

struct Corruption {
    const char *name;
    std::function<void(QByteArray &, const Layout &)> apply;
    const char *expectedInError;
};

// A valid catalogue of three messages and its layout.
const Layout &validLayout()
{
    static const Layout layout{test::compilePo(test::poSource({{QStringLiteral("alpha"), QStringLiteral("Alpha")},
                                                               {QStringLiteral("beta"), QStringLiteral("Beta")},
                                                               {QStringLiteral("gamma"), QStringLiteral("Gamma")}}))};
    return layout;
}

class MoCatalogCorruptionTest : public ::testing::TestWithParam<Corruption> {
protected:
    void SetUp() override
    {
        ASSERT_GE(validLayout().data.size(), 28);
        ASSERT_EQ(validLayout().count(), 4u); // the header entry and three messages
        ASSERT_TRUE(parseMoCatalog(validLayout().data).isValid());
    }
};

// Each corruption of the header, the tables or the strings gives an error saying what is wrong, and no strings.
TEST_P(MoCatalogCorruptionTest, IsAnError)
{
    QByteArray data = validLayout().data;
    GetParam().apply(data, validLayout());
    const MoCatalog catalog = parseMoCatalog(data);
    EXPECT_FALSE(catalog.isValid());
    EXPECT_TRUE(catalog.strings.isEmpty());
    EXPECT_TRUE(catalog.error.contains(QLatin1String(GetParam().expectedInError))) << catalog.error.toStdString();
}

INSTANTIATE_TEST_SUITE_P(Corruptions, MoCatalogCorruptionTest, ::testing::Values(
    Corruption{"TruncatedHeader", [](QByteArray &d, const Layout &) { d.truncate(27); }, "too short"},
    Corruption{"BadMagic", [](QByteArray &d, const Layout &) { putWord(d, 0, 0xdeadbeef); }, "magic"},
    Corruption{"UnsupportedRevision", [](QByteArray &d, const Layout &) { putWord(d, 4, 2u << 16); }, "revision"},
    Corruption{"HugeStringCount", [](QByteArray &d, const Layout &) { putWord(d, 8, 0xffffffffu); }, "count"},
    Corruption{"CountJustTooLargeForTheTables", [](QByteArray &d, const Layout &l) { putWord(d, 8, l.count() + 40); }, ""},
    Corruption{"OriginalTablePastTheEnd", [](QByteArray &d, const Layout &) { putWord(d, 12, quint32(d.size() - 8)); }, "past the end"},
    Corruption{"TranslationTableOffsetNear4GiB", [](QByteArray &d, const Layout &) { putWord(d, 16, 0xfffffff8u); }, "past the end"},
    Corruption{"TablesOverlapEachOther", [](QByteArray &d, const Layout &l) { putWord(d, 16, l.originals() + 8); }, "overlap"},
    Corruption{"TableOverlapsTheHeader", [](QByteArray &d, const Layout &) { putWord(d, 12, 4); }, "overlap"},
    Corruption{"StringOffsetPastTheEnd", [](QByteArray &d, const Layout &l) { putWord(d, l.originals() + 8 + 4, quint32(d.size() + 100)); }, "past the end"},
    Corruption{"StringLengthPastTheEnd", [](QByteArray &d, const Layout &l) { putWord(d, l.originals() + 8, 0xffffffffu); }, "past the end"},
    Corruption{"OffsetPlusLengthWraps32Bits", [](QByteArray &d, const Layout &l) {
        putWord(d, l.translations() + 8, 0xffffffffu);
        putWord(d, l.translations() + 8 + 4, 0xffffffffu);
    }, "past the end"},
    Corruption{"StringWithoutItsNul", [](QByteArray &d, const Layout &l) { d[l.originalOffset(1) + l.originalLength(1)] = 'X'; }, "NUL"},
    Corruption{"StringOverlappingTheDescriptorTables", [](QByteArray &d, const Layout &l) {
        putWord(d, l.originals() + 8, 3);
        putWord(d, l.originals() + 8 + 4, l.originals());
    }, "overlaps"},
    Corruption{"StringOverlappingTheHeader", [](QByteArray &d, const Layout &l) {
        putWord(d, l.originals() + 8, 2);
        putWord(d, l.originals() + 8 + 4, 0);
    }, ""},
    Corruption{"InvalidUtf8InAString", [](QByteArray &d, const Layout &l) { d[l.originalOffset(2)] = char(0xff); }, "charset"},
    Corruption{"StringEndingInsideAUtf8Sequence",
               [](QByteArray &d, const Layout &l) { d[l.originalOffset(2) + l.originalLength(2) - 1] = char(0xc3); }, "charset"}),
    zaf::test::caseName);

TEST(MoCatalogBoundsTest, EveryTruncationIsAnError)
{
    for (qsizetype size = 0; size < validLayout().data.size(); ++size) {
        const QByteArray prefix(validLayout().data.constData(), size); // a copy: reads past it are caught
        EXPECT_FALSE(parseMoCatalog(prefix).isValid()) << "prefix of " << size << " bytes";
    }
}

// Every header or descriptor word set to an edge value is read without a crash (most of them are
// fatal: the magic, table offsets, any length of 0xffffffff).
TEST(MoCatalogBoundsTest, EdgeValuedWordsAreReadWithinBounds)
{
    const Layout &layout = validLayout();
    const qint64 end = qMax<qint64>(layout.originals(), layout.translations()) + 8 * layout.count();
    int errors = 0;
    for (qint64 at = 0; at + 4 <= end; at += 4) {
        for (quint32 value : {0u, 1u, 0x7fffffffu, 0xfffffff0u, 0xffffffffu, quint32(layout.data.size())}) {
            QByteArray data = layout.data;
            putWord(data, at, value);
            errors += parseMoCatalog(data).isValid() ? 0 : 1;
        }
    }
    EXPECT_GT(errors, int(end / 4));
}

} // namespace
} // namespace zaf::bundle
