#include "AccessReport.h"

#include "common/AppStrings.h"
#include "common/Parallel.h"
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
    FtpServerConfig::MetadataPass pass(config);
    LoginForecast forecast(config);
    report.serverFindings = forecast.serverFindings();
    report.serverFails = forecast.serverFails();

    std::vector<std::pair<QByteArray, QString>> users;
    users.reserve(config.accounts().accounts().size() + config.accounts().virtualUsers().size() + 1);
    for (const auto &entry : config.accounts().accounts())
        users.emplace_back(entry.first, QStringLiteral("local"));
    const QString virtualKind = QStringLiteral("virtual");
    for (const auto &entry : config.accounts().virtualUsers())
        users.emplace_back(entry.first, virtualKind);
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
            for (size_t i = first; i < end; ++i) {
                if (users[i].second == virtualKind)
                    by.knownVirtualUser(users[i].first);
                forecasts[i] = by.userForecast(users[i].first);
            }
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
        if (kind == virtualKind)
            pass.knownVirtualUser(name);
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

// Makes the text of rows [0, count) two blocks at a time, one on each
// thread, and hands the blocks on in order: the whole text would be as
// large again as the rows it comes from.
void formatInBlocks(int count, const std::function<void(int, int, QByteArray &)> &format,
                    const std::function<void(const QByteArray &)> &write)
{
    constexpr int Block = 4096;
    for (int first = 0; first < count; first += 2 * Block) {
        const int middle = std::min(first + Block, count);
        const int end = std::min(middle + Block, count);
        QByteArray out;
        QByteArray after;
        onTwoThreads([&] { format(first, middle, out); }, [&] { format(middle, end, after); });
        write(out);
        write(after);
    }
}

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
    // then the lines. Each half of the rows on a thread of its own.
    const int columns = header.size();
    const size_t width = static_cast<size_t>(columns);
    std::vector<QString> cells(static_cast<size_t>(rows.size() + 1) * width);
    std::copy(header.begin(), header.end(), cells.begin());
    const AppStrings &strings = AppStrings::instance();
    const QString none = QStringLiteral("-");
    const auto makeCells = [&](int first, int end, QVector<int> &widths) {
        widths.fill(0, columns);
        for (int r = first; r < end; ++r) {
            const ReportRow &row = rows[r];
            const bool failed = !row.failure.message.isEmpty();
            QString *cell = &cells[static_cast<size_t>(r + 1) * width];
            cell[0] = QString::fromUtf8(row.name);
            cell[1] = row.kind;
            cell[2] = row.allowed ? strings.allowed : strings.denied;
            cell[3] = forecastStatusText(row.forecast.status);
            cell[4] = QString::fromUtf8(row.directory);
            cell[5] = row.rights.isEmpty() ? none : row.rights;
            cell[6] = failed ? failureKindText(row.failure.kind) : none;
            cell[7] = failed ? row.failure.message : none;
            cell[8] = row.forecast.findings.isEmpty() ? serverSays : findingText(row.forecast.findings.first());
            for (int i = 0; i < columns; ++i)
                widths[i] = std::max(widths[i], static_cast<int>(cell[i].size()));
        }
    };
    const int middle = rows.size() / 2;
    QVector<int> widths;
    QVector<int> laterWidths;
    onTwoThreads([&] { makeCells(0, middle, widths); }, [&] { makeCells(middle, rows.size(), laterWidths); });
    for (int i = 0; i < columns; ++i)
        widths[i] = std::max({widths[i], laterWidths[i], static_cast<int>(header[i].size())});

    QByteArray out;
    for (const ForecastFinding &finding : report.serverFindings) {
        out += QStringLiteral("server %1: %2\n").arg(severityText(finding.severity), findingText(finding)).toUtf8();
    }
    if (!report.serverFindings.isEmpty())
        out += '\n';
    write(out);
    // Line 0 is the header.
    formatInBlocks(
        rows.size() + 1,
        [&](int first, int end, QByteArray &text) {
            QString line;
            for (int l = first; l < end; ++l) {
                line.clear();
                for (int i = 0; i < columns; ++i) {
                    const QString &cell = cells[static_cast<size_t>(l) * width + static_cast<size_t>(i)];
                    line += cell;
                    if (i + 1 < columns && cell.size() < widths[i] + 2)
                        line.resize(line.size() + widths[i] + 2 - cell.size(), QLatin1Char(' '));
                }
                text += QStringView(line).trimmed().toUtf8();
                text += '\n';
            }
        },
        write);
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
    write(out);
    const AppStrings &strings = AppStrings::instance();
    formatInBlocks(
        report.rows.size(),
        [&](int first, int end, QByteArray &text) {
            for (int i = first; i < end; ++i) {
                const ReportRow &row = report.rows[i];
                const bool failed = !row.failure.message.isEmpty();
                text += "        {\n            \"directory\": ";
                appendJsonString(text, QString::fromUtf8(row.directory));
                text += ",\n            \"failureKind\": ";
                text += QByteArray::number(failed ? static_cast<int>(row.failure.kind) : 0);
                text += ",\n            \"failureText\": ";
                appendJsonString(text, failed ? failureKindText(row.failure.kind) : QString());
                text += ",\n            \"forecast\": {\n                \"findings\": ";
                appendFindings(text, row.forecast.findings);
                text += ",\n                \"status\": ";
                appendJsonString(text, forecastStatusText(row.forecast.status));
                text += "\n            },\n            \"kind\": ";
                appendJsonString(text, row.kind);
                text += ",\n            \"message\": ";
                appendJsonString(text, row.failure.message);
                text += ",\n            \"name\": ";
                appendJsonString(text, QString::fromUtf8(row.name));
                text += ",\n            \"rights\": ";
                appendJsonString(text, row.rights);
                text += ",\n            \"status\": ";
                appendJsonString(text, row.allowed ? strings.allowed : strings.denied);
                text += i + 1 < report.rows.size() ? "\n        },\n" : "\n        }\n";
            }
        },
        write);
    write(framed.mid(placeholder + 10));
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
