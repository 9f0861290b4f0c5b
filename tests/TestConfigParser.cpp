#include "TestMain.h"
#include "RoundTrip.h"
#include "config/ConfigFile.h"

#include <QDir>
#include <QDirIterator>
#include <QFile>
#include <QTemporaryDir>
#include <QtTest>

#include <sstream>

namespace {

QString describe(const ConfigElementList &list);

QString describeComments(const ConfigElementList &comments)
{
    return comments.empty() ? QString() : QStringLiteral("<%1>").arg(describe(comments));
}

QString describeOne(const ConfigElementPtr &element)
{
    const QString x = QString::number(element->xOffset());
    switch (element->type()) {
    case ElementType::ELine:
        return QStringLiteral("E");
    case ElementType::Comment: {
        const auto c = std::dynamic_pointer_cast<ConfigElementComment>(element);
        return QStringLiteral("C%1%2%3").arg(x, QChar::fromLatin1(c->commentChar), QString::fromStdString(c->text));
    }
    case ElementType::CommentBlock:
        return QStringLiteral("B(%1)").arg(
            describe(std::dynamic_pointer_cast<ConfigElementCommentBlock>(element)->comments));
    case ElementType::Data: {
        const auto d = std::dynamic_pointer_cast<ConfigElementData>(element);
        return QStringLiteral("D%1[%2|%3|%4|%5]%6")
            .arg(x, QString::fromStdString(d->key), QString::number(d->gapBefore), QString::number(d->gapAfter),
                 QString::fromStdString(d->value), describeComments(d->comments));
    }
    case ElementType::Expr: {
        const auto e = std::dynamic_pointer_cast<ConfigElementExpr>(element);
        QStringList tokens;
        for (const auto &t : e->tokens)
            tokens << QString::fromStdString(t.text) + QLatin1Char('/') + QString::number(t.gap);
        return QStringLiteral("X%1[%2]%3").arg(x, tokens.join(QLatin1Char(' ')), describeComments(e->comments));
    }
    case ElementType::Include: {
        const auto i = std::dynamic_pointer_cast<ConfigElementInclude>(element);
        return QStringLiteral("I%1[%2|%3|%4]%5")
            .arg(x, QString::fromStdString(i->keyword), QString::number(i->gap), QString::fromStdString(i->argument),
                 describeComments(i->comments));
    }
    case ElementType::Section: {
        const auto s = std::dynamic_pointer_cast<ConfigElementSection>(element);
        return QStringLiteral("S%1/%2[%3]{%4}%5%6")
            .arg(QString::number(static_cast<int>(s->style)), x, QString::fromStdString(s->name), describe(s->children),
                 QString::number(s->closeIndent), describeComments(s->comments));
    }
    }
    return QStringLiteral("?");
}

QString describe(const ConfigElementList &list)
{
    QStringList parts;
    for (const auto &element : list)
        parts << describeOne(element);
    return parts.join(QStringLiteral(" ; "));
}

std::string printed(const ConfigElementPtr &element)
{
    std::ostringstream out;
    element->print(out);
    return out.str();
}

// The files a Debian 12 machine with vsftpd and PAM installed carries, copied
// so that nothing the test does can touch the originals.
struct RealFile
{
    QString label;
    QString copy;
    SyntaxMode mode;
};

} // namespace

class TestConfigParser : public QObject
{
    Q_OBJECT

private slots:
    void initTestCase();
    void printElements();
    void parse_data();
    void parse();
    void roundTrip_data();
    void roundTrip();
    void realFiles_data();
    void realFiles();
    void bracketControlsAreTokenLines();

private:
    QTemporaryDir m_copies;
    QList<RealFile> m_realFiles;
};

void TestConfigParser::initTestCase()
{
    QVERIFY(m_copies.isValid());
    const struct
    {
        QString dir;
        SyntaxMode mode;
        bool recursive;
    } sources[] = {
        {QStringLiteral("/etc/pam.d"), SyntaxMode::TokenLine, false},
        {QStringLiteral("/usr/share/doc/vsftpd/examples"), SyntaxMode::KeyValue, true},
    };
    for (const auto &source : sources) {
        QVERIFY2(QDir(source.dir).exists(), qPrintable(source.dir + QStringLiteral(" is missing: install vsftpd")));
        QDirIterator it(source.dir, QDir::Files,
                        source.recursive ? QDirIterator::Subdirectories : QDirIterator::NoIteratorFlags);
        while (it.hasNext()) {
            const QString path = it.next();
            if (path.endsWith(QLatin1String(".gz")))
                continue;
            const QString copy = m_copies.filePath(QString::number(m_realFiles.size()));
            QVERIFY(QFile::copy(path, copy));
            m_realFiles.append({path, copy, source.mode});
        }
    }
    const QString mainConfig = QStringLiteral("/etc/vsftpd.conf");
    QVERIFY2(QFile::exists(mainConfig), "/etc/vsftpd.conf is missing: install vsftpd");
    const QString copy = m_copies.filePath(QStringLiteral("vsftpd.conf"));
    QVERIFY(QFile::copy(mainConfig, copy));
    m_realFiles.append({mainConfig, copy, SyntaxMode::KeyValue});
    QVERIFY(m_realFiles.size() > 10);
}

void TestConfigParser::printElements()
{
    auto data = std::make_shared<ConfigElementData>("key", "value");
    QCOMPARE(printed(data), std::string("key=value\n"));
    data->gapBefore = 1;
    data->gapAfter = 1;
    QCOMPARE(printed(data), std::string("key = value\n"));

    auto single = std::make_shared<ConfigElementExpr>();
    single->tokens.push_back({"token", 7});
    QCOMPARE(printed(single), std::string("token\n"));

    auto deep = std::make_shared<ConfigElementData>("k", "v", 9, 0);
    QCOMPARE(printed(deep), std::string("\t\t k=v\n"));

    QCOMPARE(printed(std::make_shared<ConfigElementCommentBlock>()), std::string());

    auto empty = std::make_shared<ConfigElementSection>("ftp", SectionStyle::Brace);
    QCOMPARE(printed(empty), std::string("service ftp { \n}\n"));

    auto include = std::make_shared<ConfigElementInclude>("@include", "common-auth", 2, 0);
    include->gap = 5;
    QCOMPARE(printed(include), std::string("  @include\t common-auth\n"));

    auto commented = std::make_shared<ConfigElementExpr>();
    commented->tokens.push_back({"root", 0});
    addComment(*commented, " first");
    addComment(*commented, " second");
    QCOMPARE(printed(commented), std::string("# first\n# second\nroot\n"));
    QCOMPARE(commented->comments.size(), size_t(1));

    ConfigFile file;
    QCOMPARE(file.text(), std::string());
}

void TestConfigParser::parse_data()
{
    QTest::addColumn<QByteArray>("input");
    QTest::addColumn<int>("mode");
    QTest::addColumn<QString>("structure");
    QTest::addColumn<QByteArray>("output");

    const int kv = static_cast<int>(SyntaxMode::KeyValue);
    const int tl = static_cast<int>(SyntaxMode::TokenLine);

    QTest::newRow("empty file") << QByteArray() << kv << QString() << QByteArray();
    QTest::newRow("plain key") << QByteArray("listen=YES\n") << kv << "D0[listen|0|0|YES]"
                               << QByteArray("listen=YES\n");
    QTest::newRow("spaced key") << QByteArray("anon_root = /srv/ftp\n") << kv << "D0[anon_root|1|1|/srv/ftp]"
                                << QByteArray("anon_root = /srv/ftp\n");
    QTest::newRow("tabs around =") << QByteArray("\t\tkey\t=  v\n") << kv << "D8[key|4|2|v]"
                                   << QByteArray("\t\tkey\t=  v\n");
    QTest::newRow("six spaces indent") << QByteArray("      key=v\n") << kv << "D6[key|0|0|v]"
                                       << QByteArray("\t  key=v\n");
    QTest::newRow("first = splits") << QByteArray("banner=a=b c\n") << kv << "D0[banner|0|0|a=b c]"
                                    << QByteArray("banner=a=b c\n");
    QTest::newRow("value keeps trailing blanks")
        << QByteArray("k=v  \n") << kv << "D0[k|0|0|v  ]" << QByteArray("k=v  \n");
    QTest::newRow("crlf kept in value") << QByteArray("listen=YES\r\n") << kv << "D0[listen|0|0|YES\r]"
                                        << QByteArray("listen=YES\r\n");
    QTest::newRow("no final newline") << QByteArray("a=1\nb=2") << kv << "D0[a|0|0|1] ; D0[b|0|0|2]"
                                      << QByteArray("a=1\nb=2\n");
    QTest::newRow("commented setting") << QByteArray("#anonymous_enable=YES\n") << kv << "B(C0#anonymous_enable=YES)"
                                       << QByteArray("#anonymous_enable=YES\n");
    QTest::newRow("comment belongs to next line")
        << QByteArray("  # note\n# more\nkey=v\n") << kv << "D0[key|0|0|v]<B(C2# note ; C0# more)>"
        << QByteArray("  # note\n# more\nkey=v\n");
    QTest::newRow("empty line separates comment")
        << QByteArray("# a\n\nkey=v\n") << kv << "B(C0# a) ; E ; D0[key|0|0|v]" << QByteArray("# a\n\nkey=v\n");
    QTest::newRow("tab-indented comment")
        << QByteArray("\t#c\n  \t#d\n") << kv << "B(C4#c ; C6#d)" << QByteArray("\t#c\n\t  #d\n");
    QTest::newRow("blank line blanks dropped")
        << QByteArray("a=1\n   \t\nb=2\n") << kv << "D0[a|0|0|1] ; E ; D0[b|0|0|2]" << QByteArray("a=1\n\nb=2\n");
    QTest::newRow("pam line") << QByteArray("auth required pam_userdb.so db=/var/lib/x\n") << tl
                              << "X0[auth/1 required/1 pam_userdb.so/1 db=/var/lib/x/0]"
                              << QByteArray("auth required pam_userdb.so db=/var/lib/x\n");
    QTest::newRow("bracket control") << QByteArray("auth\t[success=1 default=ignore]\tpam_unix.so nullok \n") << tl
                                     << "X0[auth/4 [success=1/1 default=ignore]/4 pam_unix.so/1 nullok/1]"
                                     << QByteArray("auth\t[success=1 default=ignore]\tpam_unix.so nullok\n");
    QTest::newRow("quotes hold blanks") << QByteArray("a 'b  c' \"d e\" f\n") << tl << "X0[a/1 'b  c'/1 \"d e\"/1 f/0]"
                                        << QByteArray("a 'b  c' \"d e\" f\n");
    QTest::newRow("open quote takes the rest")
        << QByteArray("a 'b c  \n") << tl << "X0[a/1 'b c  /0]" << QByteArray("a 'b c  \n");
    QTest::newRow("include") << QByteArray("@include common-auth\n") << tl << "I0[@include|1|common-auth]"
                             << QByteArray("@include common-auth\n");
    QTest::newRow("at sign inside a token")
        << QByteArray("auth x pam_a.so user@host\n") << tl << "X0[auth/1 x/1 pam_a.so/1 user@host/0]"
        << QByteArray("auth x pam_a.so user@host\n");
    QTest::newRow("bracket section") << QByteArray("[global]\nkey=v\n") << kv << "S0/0[global]{}0 ; D0[key|0|0|v]"
                                     << QByteArray("[global]\nkey=v\n");
    QTest::newRow("bracket with text after is no section")
        << QByteArray("[a] b\n") << tl << "X0[[a]/1 b/0]" << QByteArray("[a] b\n");
    QTest::newRow("brace block") << QByteArray("# xinetd\nservice ftp {\n\tdisable = no\n  }\nx=1\n") << kv
                                 << "S1/0[ftp]{D4[disable|1|1|no]}2<B(C0# xinetd)> ; D0[x|0|0|1]"
                                 << QByteArray("# xinetd\nservice ftp { \n\tdisable = no\n  }\nx=1\n");
    QTest::newRow("brace on its own line stays text") << QByteArray("service ftp\n{\n\tdisable = no\n}\n") << kv
                                                      << "X0[service/1 ftp/0] ; X0[{/0] ; D4[disable|1|1|no] ; X0[}/0]"
                                                      << QByteArray("service ftp\n{\n\tdisable = no\n}\n");
    QTest::newRow("unclosed block stays text")
        << QByteArray("service ftp {\nx=1\n") << kv << "X0[service/1 ftp/1 {/0] ; D0[x|0|0|1]"
        << QByteArray("service ftp {\nx=1\n");
    QTest::newRow("lone closing brace") << QByteArray("}\n") << kv << "X0[}/0]" << QByteArray("}\n");
    QTest::newRow("equals is ordinary in token mode")
        << QByteArray("db=/x\n") << tl << "X0[db=/x/0]" << QByteArray("db=/x\n");
}

void TestConfigParser::parse()
{
    QFETCH(QByteArray, input);
    QFETCH(int, mode);
    QFETCH(QString, structure);
    QFETCH(QByteArray, output);

    ConfigFile file(static_cast<SyntaxMode>(mode));
    std::istringstream in(input.toStdString());
    file.parse(in);
    QCOMPARE(describe(file.elements), structure);
    QCOMPARE(QByteArray::fromStdString(file.text()), output);
}

void TestConfigParser::roundTrip_data()
{
    QTest::addColumn<QByteArray>("input");

    QTest::newRow("crlf everywhere") << QByteArray("# c\r\nlisten=YES\r\n\r\n  auth  x\r\n");
    static const char binary[] = "k\0ey=v\xff\xfe\n\x80\x81 \0 z\n#\xe9t\xe9\n";
    QTest::newRow("nul and 8-bit") << QByteArray(binary, sizeof binary - 1);
    QTest::newRow("symbols inside values") << QByteArray("a={=}@\nb = @x } {\n@inc=lude { }\n[x=y]\n");
    QTest::newRow("lone closing braces") << QByteArray("}\n}\n  }  \n");
    QTest::newRow("only comments") << QByteArray("#a\n# b\n\t#\t c\n#\n");
    QTest::newRow("nested blocks") << QByteArray("service a {\nservice b {\nx=1\n}\n}\n");
    QTest::newRow("blanks only") << QByteArray(" \t \n\n \t");
    QTest::newRow("no newline at all") << QByteArray("   key   =   value   ");
    QTest::newRow("one megabyte line")
        << QByteArray(1 << 20, 'x').append("= ").append(QByteArray(1 << 20, ' ')).append("y\n");
    QTest::newRow("one megabyte of tokens") << QByteArray(1 << 20, ' ').replace(' ', "a \t").left(1 << 20);

    const QDir corpus(QStringLiteral(FTPCONFIG_TEST_DATA "/config-corpus"));
    const QStringList entries = corpus.entryList(QDir::Files);
    QVERIFY2(!entries.isEmpty(), "the committed corpus is missing");
    for (const QString &name : entries) {
        QFile file(corpus.filePath(name));
        QVERIFY(file.open(QIODevice::ReadOnly));
        QTest::newRow(qPrintable(QStringLiteral("corpus/") + name)) << file.readAll();
    }
}

void TestConfigParser::roundTrip()
{
    QFETCH(QByteArray, input);
    for (const SyntaxMode mode : {SyntaxMode::KeyValue, SyntaxMode::TokenLine})
        QCOMPARE(QString::fromStdString(roundTripViolation(input.toStdString(), mode)), QString());
}

void TestConfigParser::realFiles_data()
{
    QTest::addColumn<QString>("copy");
    QTest::addColumn<int>("mode");
    for (const RealFile &file : qAsConst(m_realFiles))
        QTest::newRow(qPrintable(file.label)) << file.copy << static_cast<int>(file.mode);
}

void TestConfigParser::realFiles()
{
    QFETCH(QString, copy);
    QFETCH(int, mode);
    QFile file(copy);
    QVERIFY(file.open(QIODevice::ReadOnly));
    const std::string content = file.readAll().toStdString();
    QCOMPARE(QString::fromStdString(roundTripViolation(content, static_cast<SyntaxMode>(mode))), QString());
}

void TestConfigParser::bracketControlsAreTokenLines()
{
    // Debian's common-auth starts its stack with "[success=1 default=ignore]";
    // such a line must stay a token line that the PAM checks can read.
    for (const RealFile &real : qAsConst(m_realFiles)) {
        if (real.mode != SyntaxMode::TokenLine)
            continue;
        QFile in(real.copy);
        QVERIFY(in.open(QIODevice::ReadOnly));
        ConfigFile file(SyntaxMode::TokenLine);
        file.parseText(in.readAll().toStdString());
        for (const auto &element : file.elements)
            QVERIFY2(element->type() != ElementType::Section, qPrintable(real.label));
    }
    QFile in(QStringLiteral("/etc/pam.d/common-auth"));
    QVERIFY(in.open(QIODevice::ReadOnly));
    ConfigFile file(SyntaxMode::TokenLine);
    file.parseText(in.readAll().toStdString());
    const auto line = findModuleLine(file.elements, "pam_unix.so");
    QVERIFY(line);
    QCOMPARE(line->tokens.front().text, std::string("auth"));
    QCOMPARE(std::next(line->tokens.begin())->text, std::string("[success=1"));
}

FTPCONFIG_TEST_GUILESS_MAIN(TestConfigParser)
#include "TestConfigParser.moc"
