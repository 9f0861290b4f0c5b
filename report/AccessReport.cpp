#include "AccessReport.h"

#include "common/AppStrings.h"
#include "policy/FtpServerConfig.h"

#include <QJsonArray>
#include <QJsonDocument>
#include <QJsonObject>

#include <algorithm>
#include <atomic>
#include <exception>
#include <functional>
#include <iostream>
#include <thread>
#include <vector>

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
    // Every user's checks and forecast see the same guest root, lists and
    // database: their metadata is read once.
    const FtpServerConfig::MetadataPass pass(config);
    LoginForecast forecast(config);
    report.serverFindings = forecast.serverFindings();
    report.serverFails = forecast.serverFails();

    std::vector<std::pair<QByteArray, QString>> users;
    users.reserve(config.accounts().accounts().size() + config.accounts().virtualUsers().size() + 1);
    for (const auto &entry : config.accounts().accounts())
        users.emplace_back(entry.first, QStringLiteral("local"));
    for (const auto &entry : config.accounts().virtualUsers())
        users.emplace_back(entry.first, QStringLiteral("virtual"));
    users.emplace_back(AppStrings::instance().anonymousUsers.toLocal8Bit(), QStringLiteral("anonymous"));

    // The forecasts only read what was loaded (and the pass's file
    // metadata, which is locked), so they are made on a second thread
    // while the verdicts, which may ask and keep caches of their own, are
    // made here; then this thread helps with the forecasts left, with a
    // forecast of its own (their caches are not shared), taking users in
    // chunks from the same counter.
    std::vector<UserForecast> forecasts(users.size());
    std::atomic<size_t> next{0};
    constexpr size_t Chunk = 256;
    const auto forecastRest = [&](LoginForecast &by) {
        for (size_t first = next.fetch_add(Chunk); first < users.size(); first = next.fetch_add(Chunk)) {
            const size_t end = std::min(first + Chunk, users.size());
            for (size_t i = first; i < end; ++i)
                forecasts[i] = by.userForecast(users[i].first);
        }
    };
    std::exception_ptr forecastError;
    std::thread worker([&] {
        try {
            forecastRest(forecast);
        } catch (...) {
            forecastError = std::current_exception();
        }
    });
    // Joined also when a verdict throws (the report's exit), so that the
    // thread is never left running.
    struct Join
    {
        std::thread &thread;
        ~Join()
        {
            if (thread.joinable())
                thread.join();
        }
    } join{worker};

    QList<ReportRow> &rows = report.rows;
    rows.reserve(static_cast<int>(users.size()));
    for (const auto &[name, kind] : users) {
        ReportRow row;
        row.name = name;
        row.kind = kind;
        row.allowed = config.checkAccess(name, false, &row.failure);
        row.directory = config.effectiveRoot(name);
        row.rights = rightsText(config.userRights(name));
        if (!row.allowed && row.failure.message.isEmpty() && interaction.pamProblems > 0) {
            // The PAM check refuses without a message of its own when the
            // PAM file does not start its stacks with pam_userdb.so; it asks
            // once and refuses every later virtual user silently.
            row.failure.message = QStringLiteral("PAM configuration problem: the first auth or account line of the "
                                                 "PAM file is not \"sufficient pam_userdb.so\"");
        }
        rows.append(std::move(row));
    }
    if (next.load() < users.size()) {
        LoginForecast helper(config);
        forecastRest(helper);
    }
    worker.join();
    if (forecastError)
        std::rethrow_exception(forecastError);
    for (int i = 0; i < rows.size(); ++i)
        rows[i].forecast = std::move(forecasts[static_cast<size_t>(i)]);
    return report;
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

// Hands the table on in pieces of about a megabyte, like the JSON.
void writeText(const Report &report, const std::function<void(const QByteArray &)> &write)
{
    const QList<ReportRow> &rows = report.rows;
    const QStringList header{QStringLiteral("USER"),   QStringLiteral("KIND"),      QStringLiteral("STATUS"),
                             QStringLiteral("SERVER"), QStringLiteral("DIRECTORY"), QStringLiteral("RIGHTS"),
                             QStringLiteral("FILE"),   QStringLiteral("REASON"),    QStringLiteral("SERVER SAYS")};
    // Without a finding of their own, rows say the first server-wide one
    // (the first error when the server fails): the same for every row.
    QString serverSays;
    for (const ForecastFinding &finding : report.serverFindings) {
        if (!report.serverFails || finding.severity == ForecastFinding::Severity::Error) {
            serverSays = findingText(finding);
            break;
        }
    }
    // The cells of every line first, since their widths make the columns;
    // then each line is padded in one reused buffer.
    const int columns = header.size();
    std::vector<QString> cells(header.begin(), header.end());
    cells.reserve(static_cast<size_t>((rows.size() + 1) * columns));
    const AppStrings &strings = AppStrings::instance();
    const QString none = QStringLiteral("-");
    for (const ReportRow &row : rows) {
        const bool failed = !row.failure.message.isEmpty();
        cells.push_back(QString::fromUtf8(row.name));
        cells.push_back(row.kind);
        cells.push_back(row.allowed ? strings.allowed : strings.denied);
        cells.push_back(forecastStatusText(row.forecast.status));
        cells.push_back(QString::fromUtf8(row.directory));
        cells.push_back(row.rights.isEmpty() ? none : row.rights);
        cells.push_back(failed ? failureKindText(row.failure.kind) : none);
        cells.push_back(failed ? row.failure.message : none);
        cells.push_back(row.forecast.findings.isEmpty() ? serverSays : findingText(row.forecast.findings.first()));
    }
    QVector<int> widths(columns, 0);
    for (size_t i = 0; i < cells.size(); ++i) {
        int &width = widths[static_cast<int>(i % static_cast<size_t>(columns))];
        width = std::max(width, static_cast<int>(cells[i].size()));
    }
    QByteArray out;
    for (const ForecastFinding &finding : report.serverFindings) {
        out += QStringLiteral("server %1: %2\n").arg(severityText(finding.severity), findingText(finding)).toUtf8();
    }
    if (!report.serverFindings.isEmpty())
        out += '\n';
    QString line;
    for (size_t first = 0; first < cells.size(); first += static_cast<size_t>(columns)) {
        line.clear();
        for (int i = 0; i < columns; ++i) {
            const QString &cell = cells[first + static_cast<size_t>(i)];
            line += cell;
            if (i + 1 < columns && cell.size() < widths[i] + 2)
                line.resize(line.size() + widths[i] + 2 - cell.size(), QLatin1Char(' '));
        }
        out += QStringView(line).trimmed().toUtf8();
        out += '\n';
        if (out.size() > (1 << 20)) {
            write(out);
            out.clear();
        }
    }
    write(out);
}

} // namespace

QByteArray reportText(const Report &report)
{
    QByteArray text;
    writeText(report, [&](const QByteArray &piece) { text += piece; });
    return text;
}

void printReportText(const Report &report, std::FILE *out)
{
    writeText(report, [&](const QByteArray &piece) {
        std::fwrite(piece.constData(), 1, static_cast<size_t>(piece.size()), out);
    });
}

namespace {

// A JSON string as QJsonDocument writes it: plain printable ASCII as it is,
// anything else through Qt itself.
void appendJsonString(QByteArray &out, const QString &text)
{
    bool plain = true;
    for (const QChar c : text) {
        const ushort u = c.unicode();
        if (u < 0x20 || u >= 0x7f || u == '"' || u == '\\') {
            plain = false;
            break;
        }
    }
    if (plain) {
        out += '"';
        out += text.toLatin1();
        out += '"';
        return;
    }
    const QByteArray quoted = QJsonDocument(QJsonArray{text}).toJson(QJsonDocument::Compact);
    out += quoted.mid(1, quoted.size() - 2);
}

// The findings array of a user at the indentation of the users' objects,
// as QJsonDocument::Indented lays it out.
void appendFindings(QByteArray &out, const QList<ForecastFinding> &findings)
{
    out += "[\n";
    for (int i = 0; i < findings.size(); ++i) {
        const ForecastFinding &finding = findings[i];
        out += "                    {\n                        \"file\": ";
        appendJsonString(out, finding.file);
        out += ",\n                        \"line\": ";
        out += QByteArray::number(finding.line);
        out += ",\n                        \"message\": ";
        appendJsonString(out, finding.message);
        out += ",\n                        \"severity\": ";
        appendJsonString(out, severityText(finding.severity));
        out += i + 1 < findings.size() ? "\n                    },\n" : "\n                    }\n";
    }
    out += "                ]";
}

} // namespace

namespace {

// Hands the text on in pieces of about a megabyte: the whole of it would
// be as large again as the rows it comes from.
void writeJson(const Report &report, const QString &root, const std::function<void(const QByteArray &)> &write)
{
    // The document is printed without its users, and the users one by one
    // into its place, in the layout and key order QJsonDocument gives them:
    // a document holding every row would keep them all twice over.
    const QJsonObject server{{QStringLiteral("fails"), report.serverFails},
                             {QStringLiteral("findings"), findingsJson(report.serverFindings)}};
    const QJsonObject frame{
        {QStringLiteral("root"), root}, {QStringLiteral("server"), server}, {QStringLiteral("users"), QJsonArray{0}}};
    // "users" sorts last: what follows its placeholder element closes the
    // array and the document.
    const QByteArray framed = QJsonDocument(frame).toJson(QJsonDocument::Indented);
    const int placeholder = framed.lastIndexOf("        0\n");
    QByteArray out = framed.left(placeholder);
    const AppStrings &strings = AppStrings::instance();
    for (int i = 0; i < report.rows.size(); ++i) {
        const ReportRow &row = report.rows[i];
        const bool failed = !row.failure.message.isEmpty();
        out += "        {\n            \"directory\": ";
        appendJsonString(out, QString::fromUtf8(row.directory));
        out += ",\n            \"failureKind\": ";
        out += QByteArray::number(failed ? static_cast<int>(row.failure.kind) : 0);
        out += ",\n            \"failureText\": ";
        appendJsonString(out, failed ? failureKindText(row.failure.kind) : QString());
        out += ",\n            \"forecast\": {\n                \"findings\": ";
        appendFindings(out, row.forecast.findings);
        out += ",\n                \"status\": ";
        appendJsonString(out, forecastStatusText(row.forecast.status));
        out += "\n            },\n            \"kind\": ";
        appendJsonString(out, row.kind);
        out += ",\n            \"message\": ";
        appendJsonString(out, row.failure.message);
        out += ",\n            \"name\": ";
        appendJsonString(out, QString::fromUtf8(row.name));
        out += ",\n            \"rights\": ";
        appendJsonString(out, row.rights);
        out += ",\n            \"status\": ";
        appendJsonString(out, row.allowed ? strings.allowed : strings.denied);
        out += i + 1 < report.rows.size() ? "\n        },\n" : "\n        }\n";
        if (out.size() > (1 << 20)) {
            write(out);
            out.clear();
        }
    }
    write(out + framed.mid(placeholder + 10));
}

} // namespace

QByteArray reportJson(const Report &report, const QString &root)
{
    QByteArray text;
    writeJson(report, root, [&](const QByteArray &piece) { text += piece; });
    return text;
}

void printReportJson(const Report &report, const QString &root, std::FILE *out)
{
    writeJson(report, root, [&](const QByteArray &piece) {
        std::fwrite(piece.constData(), 1, static_cast<size_t>(piece.size()), out);
    });
}

void printReport(const Report &report, const QString &root, bool json, std::FILE *out)
{
    if (json)
        printReportJson(report, root, out);
    else
        printReportText(report, out);
}
