#pragma once

#include "forecast/LoginForecast.h"
#include "policy/AccessFailure.h"
#include "policy/Interaction.h"

#include <QByteArray>
#include <QList>
#include <QString>

#include <cstdio>

class FtpServerConfig;

// One row of the users table as the report prints it.
struct ReportRow
{
    QByteArray name;
    QString kind; // "local", "virtual" or "anonymous"
    bool allowed = false;
    AccessFailure failure;
    QByteArray directory; // the effective FTP root
    QString rights; // as the table's mode column shows them
    UserForecast forecast; // what the server itself will do
};

struct Report
{
    QList<ReportRow> rows;
    QList<ForecastFinding> serverFindings;
    bool serverFails = false;
};

// Answers every question without asking anybody and without repairing:
// messages go to standard error, questions get their refusing answer.
class ReportInteraction : public Interaction
{
public:
    void show(const Message &message) override;
    Button ask(const Question &question) override;
    std::optional<QString> chooseOwner(const QStringList &accounts) override;
    std::optional<QString> askPath(const QString &label, const QString &initial) override;
    PamChoice askPamProblem() override;
    [[noreturn]] void exitProcess(int status) override;

    // Counts PAM problem dialogs that were answered with "Skip".
    int pamProblems = 0;
};

// Every user of the table, local, virtual, then the anonymous row, with the
// verdict of checkAccess without repair and the forecast beside it.
Report buildReport(FtpServerConfig &config, ReportInteraction &interaction);
QByteArray reportText(const Report &report);
// The same table written to the stream as it is made.
void printReportText(const Report &report, std::FILE *out);
QByteArray reportJson(const Report &report, const QString &root);
// The same JSON written to the stream as it is made.
void printReportJson(const Report &report, const QString &root, std::FILE *out);
// The one or the other, as ftpconfig-report and ftpconfig-ctl list print it.
void printReport(const Report &report, const QString &root, bool json, std::FILE *out);
