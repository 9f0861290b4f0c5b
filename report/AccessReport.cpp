#include "AccessReport.h"

#include "common/AppStrings.h"
#include "policy/FtpServerConfig.h"

#include <QJsonArray>
#include <QJsonDocument>
#include <QJsonObject>

#include <algorithm>
#include <iostream>

void ReportInteraction::show(const Message &message)
{
    QString line = message.title.isEmpty() ? message.text : message.title + QStringLiteral(": ") + message.text;
    if (!message.informativeText.isEmpty())
        line += QLatin1Char(' ') + message.informativeText;
    std::cerr << "ftpconfig-report: " << line.replace(QLatin1Char('\n'), QLatin1Char(' ')).toLocal8Bit().constData()
              << std::endl;
}

Interaction::Button ReportInteraction::ask(const Question &question)
{
    for (const Button refusing : {Button::Cancel, Button::No})
        if (question.buttons.contains(refusing))
            return refusing;
    return question.buttons.isEmpty() ? Button::Cancel : question.buttons.last();
}

std::optional<QString> ReportInteraction::chooseOwner(const QStringList &)
{
    return std::nullopt;
}

std::optional<QString> ReportInteraction::askPath(const QString &, const QString &)
{
    return std::nullopt;
}

Interaction::PamChoice ReportInteraction::askPamProblem()
{
    ++pamProblems;
    return PamChoice::Skip;
}

void ReportInteraction::exitProcess(int status)
{
    throw ProcessExit{status};
}

Report buildReport(FtpServerConfig &config, ReportInteraction &interaction)
{
    Report report;
    LoginForecast forecast(config);
    report.serverFindings = forecast.serverFindings();
    report.serverFails = forecast.serverFails();
    QList<ReportRow> &rows = report.rows;
    const auto evaluate = [&](const QByteArray &name, const QString &kind) {
        ReportRow row;
        row.name = name;
        row.kind = kind;
        row.allowed = config.checkAccess(name, false, &row.failure);
        row.directory = config.effectiveRoot(name);
        row.rights = rightsText(config.userRights(name));
        row.forecast = forecast.forecast(name);
        if (!row.allowed && row.failure.message.isEmpty() && interaction.pamProblems > 0) {
            // The PAM check refuses without a message of its own when the
            // PAM file does not start its stacks with pam_userdb.so; it asks
            // once and refuses every later virtual user silently.
            row.failure.message = QStringLiteral("PAM configuration problem: the first auth or account line of the "
                                                 "PAM file is not \"sufficient pam_userdb.so\"");
        }
        rows.append(row);
    };
    for (const auto &entry : config.accounts().accounts())
        evaluate(entry.first, QStringLiteral("local"));
    for (const auto &entry : config.accounts().virtualUsers())
        evaluate(entry.first, QStringLiteral("virtual"));
    evaluate(AppStrings::instance().anonymousUsers.toLocal8Bit(), QStringLiteral("anonymous"));
    return report;
}

QString findingText(const ForecastFinding &finding)
{
    QString out;
    if (!finding.file.isEmpty())
        out += finding.file + (finding.line > 0 ? QStringLiteral(":%1").arg(finding.line) : QString())
            + QStringLiteral(": ");
    return out + finding.message;
}

namespace {

QJsonArray findingsJson(const QList<ForecastFinding> &findings)
{
    QJsonArray array;
    for (const ForecastFinding &finding : findings) {
        array.append(QJsonObject{{QStringLiteral("severity"), severityText(finding.severity)},
                                 {QStringLiteral("file"), finding.file},
                                 {QStringLiteral("line"), finding.line},
                                 {QStringLiteral("message"), finding.message}});
    }
    return array;
}

} // namespace

QByteArray reportText(const Report &report)
{
    const QList<ReportRow> &rows = report.rows;
    const QStringList header{QStringLiteral("USER"),   QStringLiteral("KIND"),      QStringLiteral("STATUS"),
                             QStringLiteral("SERVER"), QStringLiteral("DIRECTORY"), QStringLiteral("RIGHTS"),
                             QStringLiteral("FILE"),   QStringLiteral("REASON"),    QStringLiteral("SERVER SAYS")};
    QList<QStringList> table{header};
    const AppStrings &strings = AppStrings::instance();
    for (const ReportRow &row : rows) {
        const bool failed = !row.failure.message.isEmpty();
        const QString said = row.forecast.findings.isEmpty() ? QString() : findingText(row.forecast.findings.first());
        table.append({QString::fromUtf8(row.name), row.kind, row.allowed ? strings.allowed : strings.denied,
                      forecastStatusText(row.forecast.status), QString::fromUtf8(row.directory),
                      row.rights.isEmpty() ? QStringLiteral("-") : row.rights,
                      failed ? failureKindText(row.failure.kind) : QStringLiteral("-"),
                      failed ? row.failure.message : QStringLiteral("-"), said});
    }
    QVector<int> widths(header.size(), 0);
    for (const QStringList &line : table)
        for (int i = 0; i < line.size(); ++i)
            widths[i] = std::max(widths[i], static_cast<int>(line[i].size()));
    QByteArray out;
    for (const ForecastFinding &finding : report.serverFindings) {
        out += QStringLiteral("server %1: %2\n").arg(severityText(finding.severity), findingText(finding)).toUtf8();
    }
    if (!report.serverFindings.isEmpty())
        out += '\n';
    for (const QStringList &line : table) {
        QString text;
        for (int i = 0; i < line.size(); ++i)
            text += i + 1 < line.size() ? line[i].leftJustified(widths[i] + 2) : line[i];
        out += text.trimmed().toUtf8() + '\n';
    }
    return out;
}

QByteArray reportJson(const Report &report, const QString &root)
{
    const QList<ReportRow> &rows = report.rows;
    QJsonArray users;
    const AppStrings &strings = AppStrings::instance();
    for (const ReportRow &row : rows) {
        const bool failed = !row.failure.message.isEmpty();
        users.append(QJsonObject{
            {QStringLiteral("name"), QString::fromUtf8(row.name)},
            {QStringLiteral("kind"), row.kind},
            {QStringLiteral("status"), row.allowed ? strings.allowed : strings.denied},
            {QStringLiteral("directory"), QString::fromUtf8(row.directory)},
            {QStringLiteral("rights"), row.rights},
            {QStringLiteral("failureKind"), failed ? static_cast<int>(row.failure.kind) : 0},
            {QStringLiteral("failureText"), failed ? failureKindText(row.failure.kind) : QString()},
            {QStringLiteral("message"), row.failure.message},
            {QStringLiteral("forecast"),
             QJsonObject{{QStringLiteral("status"), forecastStatusText(row.forecast.status)},
                         {QStringLiteral("findings"), findingsJson(row.forecast.findings)}}},
        });
    }
    const QJsonObject server{{QStringLiteral("fails"), report.serverFails},
                             {QStringLiteral("findings"), findingsJson(report.serverFindings)}};
    const QJsonObject document{
        {QStringLiteral("root"), root}, {QStringLiteral("server"), server}, {QStringLiteral("users"), users}};
    return QJsonDocument(document).toJson(QJsonDocument::Indented);
}
