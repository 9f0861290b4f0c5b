#include "Scenario.h"
#include "TestMain.h"
#include "config/ConfigFile.h"

#include <algorithm>

#include <QtTest>

// Each row of config-edits.txt parses a file, applies one edit and compares
// the printed result, so a row reads like the administrator's file before
// and after.
class TestConfigEdits : public QObject
{
    Q_OBJECT

private slots:
    void edits_data()
    {
        addScenarioRows(QStringLiteral("config-edits.txt"));
    }

    void edits()
    {
        QFETCH(Scenario, scenario);
        const QString operation = scenario.value(QStringLiteral("op"));
        std::vector<std::string> args;
        for (const QString &arg : scenario.values(QStringLiteral("arg")))
            args.push_back(arg.toStdString());
        args.resize(std::max<size_t>(args.size(), 4));
        const bool keyValue = operation == QLatin1String("setValue") || operation == QLatin1String("appendData");
        ConfigFile file(keyValue ? SyntaxMode::KeyValue : SyntaxMode::TokenLine);
        file.parseText(scenario.value(QStringLiteral("input")).toStdString());
        const QString output = scenario.value(QStringLiteral("output"));
        if (operation == QLatin1String("moduleArgument")) {
            QCOMPARE(QString::fromStdString(moduleArgument(file.elements, args[0], args[1])), output);
            return;
        }
        if (operation == QLatin1String("setValue")) {
            setValue(file.elements, args[0], args[1], args[2], args[3], 0);
        } else if (operation == QLatin1String("appendData")) {
            appendData(file.elements, args[0], args[1], args[2]);
        } else if (operation == QLatin1String("remove")) {
            removeTokenEverywhere(file.elements, args[0]);
            QVERIFY(!containsToken(file.elements, args[0]));
        } else if (operation == QLatin1String("append") || operation == QLatin1String("top")) {
            std::vector<std::string> tokens = args;
            tokens.erase(std::remove(tokens.begin(), tokens.end(), std::string()), tokens.end());
            insertTokenLine(file.elements, tokens, operation == QLatin1String("top") ? InsertAt::Top : InsertAt::End);
            QVERIFY(containsToken(file.elements, args[0]));
        } else if (operation == QLatin1String("setArgument")) {
            const auto line = findModuleLine(file.elements, args[0]);
            QVERIFY(line);
            QVERIFY(setTokenArgument(*line, args[1], args[2]));
            QVERIFY(!setTokenArgument(*line, "absent", "x"));
        } else {
            QFAIL("unknown operation");
        }
        QCOMPARE(QString::fromStdString(file.text()), output);
    }

    void queries()
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

    void commentsTravelWithTheirLine()
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
};

FTPCONFIG_TEST_GUILESS_MAIN(TestConfigEdits)

#include "TestConfigEdits.moc"
