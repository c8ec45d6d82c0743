// The .mo reader: msgfmt output in both byte orders, and corrupt catalogues that must give an error.
#include "platform/bundle/mo_catalog.h"
#include "tests/platform/bundle/bundle_fixtures.h"

#include <QFile>
#include <QTemporaryDir>
#include <QtEndian>
#include <gtest/gtest.h>

#include <functional>
#include <vector>

namespace zaf::bundle {
namespace {

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

// In both byte orders, contexts are keyed "context\x04id", plurals by their singular form, and the
// header and untranslated entries are no messages.
TEST(MoCatalogTest, ParsesMsgfmtOutputWithContextPluralsAndHeader)
{
    for (const ByteOrder order : {ByteOrder::Little, ByteOrder::Big}) {
        const MoCatalog catalog = parseMoCatalog(test::compilePo(kRichPo, order));
        ASSERT_TRUE(catalog.isValid()) << catalog.error.toStdString();
        EXPECT_EQ(catalog.strings, (QHash<QString, QString>{{QStringLiteral("Hello"), QStringLiteral("Hallo")},
                                                        {QStringLiteral("SHARE_TEXT_FORMAT"), QStringLiteral("Geteilt mit %@ \"Zitat\"")},
                                                        {QStringLiteral("Open"), QStringLiteral("Aufmachen")},
                                                        {QStringLiteral("menu\x04Open"), QStringLiteral("Öffnen")},
                                                        {QStringLiteral("%d file"), QStringLiteral("%d Datei")}}))
            << (order == ByteOrder::Big ? "big-endian" : "little-endian");
    }
}

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

// Strings are decoded in the charset the header declares.
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

// A file is read whole; a missing, corrupt or too large (over 16 MiB) file gives an error naming it.
TEST(MoCatalogTest, ReadsAFileAndNamesItInErrors)
{
    QTemporaryDir dir;
    const QByteArray valid = test::compilePo(test::poSource({{QStringLiteral("a"), QStringLiteral("b")}}));
    const QString good = dir.filePath(QStringLiteral("good.mo"));
    test::writeFile(good, valid);
    const MoCatalog read = readMoCatalog(good);
    ASSERT_TRUE(read.isValid()) << read.error.toStdString();
    EXPECT_EQ(read.strings.value(QStringLiteral("a")), QStringLiteral("b"));

    const MoCatalog missing = readMoCatalog(dir.filePath(QStringLiteral("missing.mo")));
    EXPECT_FALSE(missing.isValid());
    EXPECT_TRUE(missing.error.contains(QStringLiteral("missing.mo")));

    test::writeFile(dir.filePath(QStringLiteral("bad.mo")), QByteArray(64, 'x'));
    const MoCatalog corrupt = readMoCatalog(dir.filePath(QStringLiteral("bad.mo")));
    EXPECT_FALSE(corrupt.isValid());
    EXPECT_TRUE(corrupt.error.contains(QStringLiteral("bad.mo")) && corrupt.error.contains(QStringLiteral("magic")))
        << corrupt.error.toStdString();

    // A valid catalogue followed by a sparse tail past the limit.
    QFile huge(dir.filePath(QStringLiteral("huge.mo")));
    ASSERT_TRUE(huge.open(QIODevice::WriteOnly));
    ASSERT_EQ(huge.write(valid), valid.size());
    ASSERT_TRUE(huge.resize(kMaxMoFileSize + 1));
    huge.close();
    const MoCatalog tooLarge = readMoCatalog(huge.fileName());
    EXPECT_FALSE(tooLarge.isValid());
    EXPECT_TRUE(tooLarge.error.contains(QStringLiteral("exceeds"))) << tooLarge.error.toStdString();
    EXPECT_TRUE(tooLarge.strings.isEmpty());
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

class MoCatalogCorruptionTest : public ::testing::Test {
protected:
    void SetUp() override
    {
        m_layout.data = test::compilePo(test::poSource({{QStringLiteral("alpha"), QStringLiteral("Alpha")},
                                                        {QStringLiteral("beta"), QStringLiteral("Beta")},
                                                        {QStringLiteral("gamma"), QStringLiteral("Gamma")}}));
        ASSERT_GE(m_layout.data.size(), 28);
        ASSERT_EQ(m_layout.count(), 4u); // the header entry and three messages
        ASSERT_TRUE(parseMoCatalog(m_layout.data).isValid());
    }
    Layout m_layout;
};

// Each corruption of the header, the tables or the strings gives an error saying what is wrong, and no strings.
TEST_F(MoCatalogCorruptionTest, EveryCorruptVariantGivesAnErrorAndNoStrings)
{
    const std::vector<Corruption> corruptions = {
        {"empty file", [](QByteArray &d, const Layout &) { d.clear(); }, "too short"},
        {"truncated header", [](QByteArray &d, const Layout &) { d.truncate(27); }, "too short"},
        {"bad magic", [](QByteArray &d, const Layout &) { putWord(d, 0, 0xdeadbeef); }, "magic"},
        {"unsupported revision", [](QByteArray &d, const Layout &) { putWord(d, 4, 2u << 16); }, "revision"},
        {"huge string count", [](QByteArray &d, const Layout &) { putWord(d, 8, 0xffffffffu); }, "count"},
        {"count just too large for the tables", [](QByteArray &d, const Layout &l) { putWord(d, 8, l.count() + 40); }, ""},
        {"original table past the end", [](QByteArray &d, const Layout &) { putWord(d, 12, quint32(d.size() - 8)); }, "past the end"},
        {"translation table offset near 4 GiB", [](QByteArray &d, const Layout &) { putWord(d, 16, 0xfffffff8u); }, "past the end"},
        {"tables overlap each other", [](QByteArray &d, const Layout &l) { putWord(d, 16, l.originals() + 8); }, "overlap"},
        {"table overlaps the header", [](QByteArray &d, const Layout &) { putWord(d, 12, 4); }, "overlap"},
        {"string offset past the end", [](QByteArray &d, const Layout &l) { putWord(d, l.originals() + 8 + 4, quint32(d.size() + 100)); }, "past the end"},
        {"string length past the end", [](QByteArray &d, const Layout &l) { putWord(d, l.originals() + 8, 0xffffffffu); }, "past the end"},
        {"offset plus length wraps 32 bits",
         [](QByteArray &d, const Layout &l) {
             putWord(d, l.translations() + 8, 0xffffffffu);
             putWord(d, l.translations() + 8 + 4, 0xffffffffu);
         },
         "past the end"},
        {"string without its NUL", [](QByteArray &d, const Layout &l) { d[l.originalOffset(1) + l.originalLength(1)] = 'X'; }, "NUL"},
        {"string overlapping the descriptor tables", [](QByteArray &d, const Layout &l) {
             putWord(d, l.originals() + 8, 3);
             putWord(d, l.originals() + 8 + 4, l.originals());
         }, "overlaps"},
        {"string overlapping the header", [](QByteArray &d, const Layout &l) {
             putWord(d, l.originals() + 8, 2);
             putWord(d, l.originals() + 8 + 4, 0);
         }, ""},
        {"invalid UTF-8 in a string", [](QByteArray &d, const Layout &l) { d[l.originalOffset(2)] = char(0xff); }, "charset"},
        {"string ending inside a UTF-8 sequence",
         [](QByteArray &d, const Layout &l) { d[l.originalOffset(2) + l.originalLength(2) - 1] = char(0xc3); }, "charset"},
        {"cut in the middle", [](QByteArray &d, const Layout &) { d.truncate(d.size() / 2); }, ""},
    };
    for (const Corruption &corruption : corruptions) {
        SCOPED_TRACE(corruption.name);
        QByteArray data = m_layout.data;
        corruption.apply(data, m_layout);
        const MoCatalog catalog = parseMoCatalog(data);
        EXPECT_FALSE(catalog.isValid());
        EXPECT_TRUE(catalog.strings.isEmpty());
        EXPECT_TRUE(catalog.error.contains(QLatin1String(corruption.expectedInError))) << catalog.error.toStdString();
    }
}

// Every truncation is an error, and every header or descriptor word set to an edge value is read
// without a crash (most of them are fatal: the magic, table offsets, any length of 0xffffffff).
TEST_F(MoCatalogCorruptionTest, TruncatedOrEdgeValuedCataloguesAreReadWithinBounds)
{
    for (qsizetype size = 0; size < m_layout.data.size(); ++size) {
        const QByteArray prefix(m_layout.data.constData(), size); // a copy: reads past it are caught
        EXPECT_FALSE(parseMoCatalog(prefix).isValid()) << "prefix of " << size << " bytes";
    }
    const qint64 end = qMax<qint64>(m_layout.originals(), m_layout.translations()) + 8 * m_layout.count();
    int errors = 0;
    for (qint64 at = 0; at + 4 <= end; at += 4) {
        for (quint32 value : {0u, 1u, 0x7fffffffu, 0xfffffff0u, 0xffffffffu, quint32(m_layout.data.size())}) {
            QByteArray data = m_layout.data;
            putWord(data, at, value);
            errors += parseMoCatalog(data).isValid() ? 0 : 1;
        }
    }
    EXPECT_GT(errors, int(end / 4));
}

} // namespace
} // namespace zaf::bundle
