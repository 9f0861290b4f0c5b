#include "Scenario.h"

#include <QFile>
#include <QRegularExpression>
#include <QtTest>

namespace {

QString unescaped(const QString &text)
{
    QString out;
    for (int i = 0; i < text.size(); ++i) {
        if (text.at(i) != QLatin1Char('\\') || i + 1 == text.size()) {
            out += text.at(i);
            continue;
        }
        const QChar next = text.at(++i);
        static const QMap<QChar, QChar> escapes{{QLatin1Char('n'), QLatin1Char('\n')},
                                                {QLatin1Char('r'), QLatin1Char('\r')},
                                                {QLatin1Char('t'), QLatin1Char('\t')}};
        out += escapes.value(next, next);
    }
    return out;
}

} // namespace

bool Scenario::has(const QString &key) const
{
    return fields.contains(key);
}

QString Scenario::value(const QString &key, const QString &defaultValue) const
{
    return fields.contains(key) ? fields.value(key).constLast() : defaultValue;
}

QByteArray Scenario::bytes(const QString &key) const
{
    return value(key).toUtf8();
}

QStringList Scenario::values(const QString &key) const
{
    return fields.value(key);
}

QList<Scenario> readScenarios(const QString &table, QString *error)
{
    QFile file(QStringLiteral(FTPCONFIG_TEST_DATA "/scenarios/") + table);
    if (!file.open(QIODevice::ReadOnly)) {
        *error = file.fileName() + QStringLiteral(": ") + file.errorString();
        return {};
    }
    static const QRegularExpression entry(QStringLiteral("^([\\w-]+|/\\S*):(?: (.*))?$"));
    Scenario defaults;
    QList<Scenario> rows;
    QString blockKey; // the field or file that "| " lines continue
    int blockLines = 0;
    int number = 0;
    for (const QByteArray &raw : file.readAll().split('\n')) {
        ++number;
        const QString line = QString::fromUtf8(raw);
        Scenario &row = rows.isEmpty() ? defaults : rows.last();
        const auto fail = [&](const char *why) {
            *error = QStringLiteral("%1:%2: %3").arg(table).arg(number).arg(QLatin1String(why));
            return QList<Scenario>();
        };
        if (line.startsWith(QLatin1Char('|'))) {
            const QString text = line.mid(line.startsWith(QLatin1String("| ")) ? 2 : 1);
            if (blockKey.startsWith(QLatin1Char('/')))
                row.files[blockKey] += text.toUtf8() + '\n';
            else if (!blockKey.isEmpty())
                row.fields[blockKey].last() += (blockLines > 0 ? QStringLiteral("\n") : QString()) + text;
            else
                return fail("a \"|\" line belongs after a field or a file");
            ++blockLines;
            continue;
        }
        blockKey.clear();
        if (line.trimmed().isEmpty() || line.startsWith(QLatin1Char('#')))
            continue;
        if (line.startsWith(QLatin1String("== "))) {
            rows << Scenario{line.mid(3), {}, {}};
            continue;
        }
        const QRegularExpressionMatch match = entry.match(line);
        if (!match.hasMatch())
            return fail("neither a row, a field nor a file");
        const QString key = match.captured(1);
        const QString value = match.captured(2);
        if (key.startsWith(QLatin1Char('/'))) {
            const QByteArray content = unescaped(value).toUtf8();
            // An empty file is not one left out: a null array is.
            row.files.insert(key,
                             value == QLatin1String("-") ? QByteArray()
                                 : content.isNull()      ? QByteArray("")
                                                         : content);
        } else {
            row.fields[key] << unescaped(value);
        }
        blockKey = value.isEmpty() ? key : QString();
        blockLines = 0;
    }
    for (Scenario &row : rows) {
        for (auto it = defaults.fields.cbegin(); it != defaults.fields.cend(); ++it) {
            if (!row.fields.contains(it.key()))
                row.fields.insert(it.key(), it.value());
        }
        for (auto it = defaults.files.cbegin(); it != defaults.files.cend(); ++it) {
            if (!row.files.contains(it.key()))
                row.files.insert(it.key(), it.value());
        }
    }
    return rows;
}

void addScenarioRows(const QStringList &tables)
{
    QTest::addColumn<Scenario>("scenario");
    for (const QString &table : tables) {
        QString error;
        const QList<Scenario> rows = readScenarios(table, &error);
        QVERIFY2(error.isEmpty(), qPrintable(error));
        QVERIFY2(!rows.isEmpty(), qPrintable(table + QStringLiteral(" has no rows")));
        for (const Scenario &row : rows)
            QTest::newRow(qPrintable(row.name)) << row;
    }
}

void addScenarioRows(const QString &table)
{
    addScenarioRows(QStringList{table});
}
