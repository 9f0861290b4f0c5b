#pragma once

#include "FixtureRoot.h"

#include <QMap>
#include <QMetaType>
#include <QString>
#include <QStringList>

// One row of a scenario table (tests/data/scenarios/*.txt). A table reads:
//
//   # a comment
//   == the row's name
//   user: bob                 a field; a key given twice keeps both values
//   message: a\nb             field values know the escapes \\, \n, \r and \t
//   texts:                    a field of several lines, each after "| "
//   | first line
//   | second line
//   /etc/vsftpd.conf:         a file of the root, each line after "| "
//   | local_enable=YES
//   /etc/ftpusers: -          a file of the fixture's defaults left out
//   /etc/crlf: a=1\r\nb       a file given in one line, with the escapes
//
// What comes before the first "==" gives every row its defaults.
struct Scenario
{
    QString name;
    QMap<QString, QStringList> fields;
    FileMap files;

    bool has(const QString &key) const;
    // The last value of the field, or the default.
    QString value(const QString &key, const QString &defaultValue = QString()) const;
    QByteArray bytes(const QString &key) const;
    QStringList values(const QString &key) const;
};
Q_DECLARE_METATYPE(Scenario)

// The rows of tests/data/scenarios/<table>; an empty list and the reason
// when the table cannot be read.
QList<Scenario> readScenarios(const QString &table, QString *error);
// In a _data function: one row "scenario" per row of the tables.
void addScenarioRows(const QStringList &tables);
void addScenarioRows(const QString &table);
