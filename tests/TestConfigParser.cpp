#include "RoundTrip.h"
#include "Scenario.h"
#include "TestMain.h"
#include "config/ConfigFile.h"

#include <QDir>
#include <QDirIterator>
#include <QFile>
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

} // namespace

class TestConfigParser : public QObject
{
    Q_OBJECT

private slots:
    void printElements()
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

    void parse_data()
    {
        addScenarioRows(QStringLiteral("config-parse.txt"));
    }

    void parse()
    {
        QFETCH(Scenario, scenario);
        const QString input = scenario.value(QStringLiteral("input"));
        ConfigFile file(scenario.value(QStringLiteral("mode")) == QLatin1String("token-line") ? SyntaxMode::TokenLine
                                                                                              : SyntaxMode::KeyValue);
        std::istringstream in(input.toStdString());
        file.parse(in);
        QCOMPARE(describe(file.elements), scenario.value(QStringLiteral("structure")));
        QCOMPARE(QString::fromStdString(file.text()), scenario.value(QStringLiteral("output"), input));
    }

    void roundTrip_data()
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

    void roundTrip()
    {
        QFETCH(QByteArray, input);
        for (const SyntaxMode mode : {SyntaxMode::KeyValue, SyntaxMode::TokenLine})
            QCOMPARE(QString::fromStdString(roundTripViolation(input.toStdString(), mode)), QString());
    }

    // The files a Debian 12 machine with vsftpd and PAM installed carries.
    void realFiles_data()
    {
        QTest::addColumn<QString>("path");
        QTest::addColumn<int>("mode");
        const QString examples = QStringLiteral("/usr/share/doc/vsftpd/examples");
        QVERIFY2(QDir(examples).exists() && QFile::exists(QStringLiteral("/etc/vsftpd.conf")), "install vsftpd");
        QTest::newRow("/etc/vsftpd.conf")
            << QStringLiteral("/etc/vsftpd.conf") << static_cast<int>(SyntaxMode::KeyValue);
        for (const auto &[dir, mode] : {std::pair(QStringLiteral("/etc/pam.d"), SyntaxMode::TokenLine),
                                        std::pair(examples, SyntaxMode::KeyValue)}) {
            QDirIterator it(dir, QDir::Files, QDirIterator::Subdirectories);
            while (it.hasNext()) {
                const QString path = it.next();
                if (!path.endsWith(QLatin1String(".gz")))
                    QTest::newRow(qPrintable(path)) << path << static_cast<int>(mode);
            }
        }
    }

    void realFiles()
    {
        QFETCH(QString, path);
        QFETCH(int, mode);
        QFile file(path);
        QVERIFY(file.open(QIODevice::ReadOnly));
        const std::string content = file.readAll().toStdString();
        QCOMPARE(QString::fromStdString(roundTripViolation(content, static_cast<SyntaxMode>(mode))), QString());
        // Debian's common-auth starts its stack with "[success=1 default=ignore]":
        // such a line must stay a token line that the PAM checks can read.
        ConfigFile parsed(static_cast<SyntaxMode>(mode));
        parsed.parseText(content);
        for (const auto &element : parsed.elements)
            QVERIFY(mode == static_cast<int>(SyntaxMode::KeyValue) || element->type() != ElementType::Section);
    }
};

FTPCONFIG_TEST_GUILESS_MAIN(TestConfigParser)

#include "TestConfigParser.moc"
