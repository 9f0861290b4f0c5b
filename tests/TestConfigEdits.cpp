#include "TestMain.h"
#include "config/ConfigFile.h"

#include <QtTest>

// Each row parses a file, applies one edit and compares the printed result,
// so a row reads like the administrator's file before and after.
class TestConfigEdits : public QObject
{
    Q_OBJECT

private slots:
    void keyValueEdits_data();
    void keyValueEdits();
    void queries();
    void tokenLineEdits_data();
    void tokenLineEdits();
    void moduleArguments_data();
    void moduleArguments();
    void commentsTravelWithTheirLine();
};

namespace {

std::string arg(const QStringList &args, int i)
{
    return i < args.size() ? args.at(i).toStdString() : std::string();
}

} // namespace

void TestConfigEdits::keyValueEdits_data()
{
    QTest::addColumn<QByteArray>("input");
    QTest::addColumn<QString>("operation");
    QTest::addColumn<QStringList>("args");
    QTest::addColumn<QByteArray>("output");

    QTest::newRow("set keeps blanks") << QByteArray("a=1\nkey = old\n") << "setValue" << QStringList{"", "key", "new"}
                                      << QByteArray("a=1\nkey = new\n");
    QTest::newRow("set keeps comments above")
        << QByteArray("# why\nkey=old\n") << "setValue" << QStringList{"", "key", "new", "ignored"}
        << QByteArray("# why\nkey=new\n");
    QTest::newRow("new key before trailing empty lines")
        << QByteArray("a=1\n\n\n") << "setValue" << QStringList{"", "key", "value"}
        << QByteArray("a=1\nkey=value\n\n\n");
    QTest::newRow("new key after trailing comment")
        << QByteArray("a=1\n# end\n\n") << "setValue" << QStringList{"", "key", "v"}
        << QByteArray("a=1\n# end\nkey=v\n\n");
    QTest::newRow("commented key is not the key")
        << QByteArray("#key=YES\n") << "setValue" << QStringList{"", "key", "NO"} << QByteArray("#key=YES\nkey=NO\n");
    QTest::newRow("first of two keys") << QByteArray("key=1\nkey=2\n") << "setValue" << QStringList{"", "key", "3"}
                                       << QByteArray("key=3\nkey=2\n");
    QTest::newRow("keys compare case-sensitively")
        << QByteArray("KEY=1\n") << "setValue" << QStringList{"", "key", "2"} << QByteArray("KEY=1\nkey=2\n");
    QTest::newRow("new key with comment")
        << QByteArray("a=1\n") << "setValue" << QStringList{"", "local_enable", "yes", " added"}
        << QByteArray("a=1\n# added\nlocal_enable=yes\n");
    QTest::newRow("append follows last indentation")
        << QByteArray("\ta=1\n# x\n") << "appendData" << QStringList{"b", "2"} << QByteArray("\ta=1\n# x\n\tb=2\n");
    QTest::newRow("append into empty file")
        << QByteArray() << "appendData" << QStringList{"listen", "YES"} << QByteArray("listen=YES\n");
    QTest::newRow("append into empty lines goes first")
        << QByteArray("\n\n") << "appendData" << QStringList{"k", "v"} << QByteArray("k=v\n\n\n");
    QTest::newRow("set inside a brace block")
        << QByteArray("service ftp {\n\tdisable = no\n}\ndisable=x\n") << "setValue"
        << QStringList{"ftp", "disable", "yes"} << QByteArray("service ftp { \n\tdisable = yes\n}\ndisable=x\n");
    QTest::newRow("add inside a brace block")
        << QByteArray("service ftp {\n\ta = b\n}\n") << "setValue" << QStringList{"ftp", "wait", "no"}
        << QByteArray("service ftp { \n\ta = b\nwait=no\n}\n");
    QTest::newRow("new section at the end")
        << QByteArray("a=1\n\n") << "setValue" << QStringList{"extra", "k", "v"} << QByteArray("a=1\n[extra]\nk=v\n\n");
}

void TestConfigEdits::keyValueEdits()
{
    QFETCH(QByteArray, input);
    QFETCH(QString, operation);
    QFETCH(QStringList, args);
    QFETCH(QByteArray, output);

    ConfigFile file(SyntaxMode::KeyValue);
    file.parseText(input.toStdString());
    if (operation == QLatin1String("setValue"))
        setValue(file.elements, arg(args, 0), arg(args, 1), arg(args, 2), arg(args, 3), 0);
    else if (operation == QLatin1String("appendData"))
        appendData(file.elements, arg(args, 0), arg(args, 1), arg(args, 2));
    else
        QFAIL("unknown operation");
    QCOMPARE(QByteArray::fromStdString(file.text()), output);
}

void TestConfigEdits::queries()
{
    ConfigFile file(SyntaxMode::KeyValue);
    file.parseText("key=top\n[sec]\nservice ftp {\n\tkey = inner\n}\n");
    QVERIFY(!findData(file.elements, "missing", "key"));
    QCOMPARE(findData(file.elements, "", "key")->value, std::string("top"));
    QCOMPARE(findData(file.elements, "ftp", "key")->value, std::string("inner"));
    QVERIFY(findSection(file.elements, "sec"));
    QVERIFY(!findSection(file.elements, "Sec"));
    QVERIFY(!findData(file.elements, "", "ke"));

    ConfigElementData same("key", "new");
    ConfigElementData other("other", "x");
    auto target = findData(file.elements, "", "key");
    QVERIFY(!target->assignIfSameKey(other));
    QCOMPARE(target->value, std::string("top"));
    QVERIFY(target->assignIfSameKey(same));
    QCOMPARE(target->value, std::string("new"));
}

void TestConfigEdits::tokenLineEdits_data()
{
    QTest::addColumn<QByteArray>("input");
    QTest::addColumn<QString>("operation");
    QTest::addColumn<QStringList>("args");
    QTest::addColumn<QByteArray>("output");

    QTest::newRow("remove a name from a list")
        << QByteArray("root\nbob\nalice\n") << "remove" << QStringList{"bob"} << QByteArray("root\nalice\n");
    QTest::newRow("remove every occurrence")
        << QByteArray("bob\nroot\nbob\n") << "remove" << QStringList{"bob"} << QByteArray("root\n");
    QTest::newRow("comment of a removed line stays")
        << QByteArray("# users\nbob\nroot\n") << "remove" << QStringList{"bob"} << QByteArray("# users\nroot\n");
    QTest::newRow("remove only the token") << QByteArray("auth required pam_x.so debug\n") << "remove"
                                           << QStringList{"debug"} << QByteArray("auth required pam_x.so\n");
    QTest::newRow("remove absent changes nothing")
        << QByteArray("root\n\n") << "remove" << QStringList{"bob"} << QByteArray("root\n\n");
    QTest::newRow("append a name") << QByteArray("root\n\n") << "append" << QStringList{"bob"}
                                   << QByteArray("root\nbob\n\n");
    QTest::newRow("insert a line at the top")
        << QByteArray("# header\n@include common-auth\n") << "top"
        << QStringList{"auth", "sufficient", "pam_userdb.so", "db=/x"}
        << QByteArray("auth sufficient pam_userdb.so db=/x\n# header\n@include common-auth\n");
    QTest::newRow("set a module argument")
        << QByteArray("auth\trequired\tpam_userdb.so\tdb=/old\n") << "setArgument"
        << QStringList{"pam_userdb.so", "db", "/new"} << QByteArray("auth\trequired\tpam_userdb.so\tdb=/new\n");
}

void TestConfigEdits::tokenLineEdits()
{
    QFETCH(QByteArray, input);
    QFETCH(QString, operation);
    QFETCH(QStringList, args);
    QFETCH(QByteArray, output);

    ConfigFile file(SyntaxMode::TokenLine);
    file.parseText(input.toStdString());
    std::vector<std::string> tokens;
    for (const QString &a : args)
        tokens.push_back(a.toStdString());
    if (operation == QLatin1String("remove")) {
        removeTokenEverywhere(file.elements, tokens.front());
        QVERIFY(!containsToken(file.elements, tokens.front()));
    } else if (operation == QLatin1String("append")) {
        insertTokenLine(file.elements, tokens, InsertAt::End);
        QVERIFY(containsToken(file.elements, tokens.front()));
    } else if (operation == QLatin1String("top")) {
        insertTokenLine(file.elements, tokens, InsertAt::Top);
    } else if (operation == QLatin1String("setArgument")) {
        const auto line = findModuleLine(file.elements, tokens[0]);
        QVERIFY(line);
        QVERIFY(setTokenArgument(*line, tokens[1], tokens[2]));
        QVERIFY(!setTokenArgument(*line, "absent", "x"));
    } else {
        QFAIL("unknown operation");
    }
    QCOMPARE(QByteArray::fromStdString(file.text()), output);
}

void TestConfigEdits::moduleArguments_data()
{
    QTest::addColumn<QByteArray>("pam");
    QTest::addColumn<QString>("module");
    QTest::addColumn<QString>("name");
    QTest::addColumn<QString>("value");

    const QByteArray debian("auth\trequired\tpam_listfile.so item=user sense=deny file=/etc/ftpusers onerr=succeed\n");
    QTest::newRow("item") << debian << "pam_listfile.so"
                          << "item"
                          << "user";
    QTest::newRow("file") << debian << "pam_listfile.so"
                          << "file"
                          << "/etc/ftpusers";
    QTest::newRow("onerr") << debian << "pam_listfile.so"
                           << "onerr"
                           << "succeed";
    QTest::newRow("absent argument") << debian << "pam_listfile.so"
                                     << "apply"
                                     << "";
    QTest::newRow("absent module") << debian << "pam_userdb.so"
                                   << "db"
                                   << "";
    QTest::newRow("module by full path") << QByteArray(
        "auth required /lib/x86_64-linux-gnu/security/pam_userdb.so db=/var/lib/ftpconfig/users\n")
                                         << "pam_userdb.so"
                                         << "db"
                                         << "/var/lib/ftpconfig/users";
    QTest::newRow("longer module name does not match")
        << QByteArray("auth required xpam_userdb.so db=/a\nauth required pam_userdb.so db=/b\n") << "pam_userdb.so"
        << "db"
        << "/b";
    QTest::newRow("first line wins") << QByteArray(
        "auth required pam_userdb.so db=/a\naccount required pam_userdb.so db=/b\n")
                                     << "pam_userdb.so"
                                     << "db"
                                     << "/a";
    QTest::newRow("prefix of a name is not the name")
        << QByteArray("auth required pam_userdb.so dbx=/a db=/b\n") << "pam_userdb.so"
        << "db"
        << "/b";
    QTest::newRow("commented line is ignored") << QByteArray("#auth required pam_userdb.so db=/a\n") << "pam_userdb.so"
                                               << "db"
                                               << "";
}

void TestConfigEdits::moduleArguments()
{
    QFETCH(QByteArray, pam);
    QFETCH(QString, module);
    QFETCH(QString, name);
    QFETCH(QString, value);
    ConfigFile file(SyntaxMode::TokenLine);
    file.parseText(pam.toStdString());
    QCOMPARE(QString::fromStdString(moduleArgument(file.elements, module.toStdString(), name.toStdString())), value);
}

void TestConfigEdits::commentsTravelWithTheirLine()
{
    ConfigFile file(SyntaxMode::KeyValue);
    file.parseText("a=1\n# explains b\n# more\nb=2\nc=3\n");
    const auto b = findData(file.elements, "", "b");
    QVERIFY(b);
    file.elements.remove(b);
    QCOMPARE(QByteArray::fromStdString(file.text()), QByteArray("a=1\nc=3\n"));
    file.elements.push_back(b);
    QCOMPARE(QByteArray::fromStdString(file.text()), QByteArray("a=1\nc=3\n# explains b\n# more\nb=2\n"));

    ConfigElementExpr line;
    line.tokens = {{"a", 1}, {"b", 1}, {"a", 0}};
    line.removeToken("a");
    QCOMPARE(line.tokens.size(), size_t(2));
    QCOMPARE(line.tokens.front().text, std::string("b"));
    QVERIFY(line.hasToken("a"));
}

FTPCONFIG_TEST_GUILESS_MAIN(TestConfigEdits)
#include "TestConfigEdits.moc"
