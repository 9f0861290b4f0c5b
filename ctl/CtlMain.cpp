// ftpconfig-ctl: the window's edits from a shell. Each command loads the
// files as the window does, makes one change through the same engine calls
// and saves through the same save (or, with --dry-run, prints what that
// save would write and writes nothing).
#include "forecast/VsftpdSettings.h"
#include "policy/FtpServerConfig.h"
#include "report/AccessReport.h"

#include "common/AppStrings.h"
#include "common/SafeFile.h"

#include <QCoreApplication>
#include <QDir>
#include <QFileInfo>

#include <cstdio>
#include <cstdlib>
#include <iostream>
#include <string>
#include <termios.h>
#include <unistd.h>

namespace {

const char Usage[] = "usage: ftpconfig-ctl [--root DIR] [--yes] [--dry-run] COMMAND [ARGUMENTS]\n"
                     "commands:\n"
                     "  list [--json]          who can log in and why not, as ftpconfig-report prints it\n"
                     "  allow USER             let the user log in, repairing what refuses it\n"
                     "  deny USER              refuse the user through the userlist\n"
                     "  root USER DIR          make DIR the user's FTP root\n"
                     "  rights USER RIGHTS     \"full access\" or some of \"write, download, upload, mkdir\"\n"
                     "  vuser add NAME         add a virtual user; the password is read from standard input\n"
                     "  vuser passwd NAME      change a virtual user's password, read from standard input\n"
                     "  vuser del NAME         delete a virtual user\n"
                     "  get KEY                print a setting of the main configuration\n"
                     "  set KEY VALUE          change a setting of the main configuration\n"
                     "  unset KEY              remove a setting from the main configuration\n"
                     "options:\n"
                     "  --root DIR  work on the files below DIR instead of / (default: $FTPCONFIG_ROOT or /)\n"
                     "  --yes       answer every question with the repair it offers\n"
                     "  --dry-run   print the unified diff of every file the command would write; write nothing\n"
                     "exit status: 0 done, 1 refused, 2 usage error or a question nobody could answer\n";

// Ends the command with a status and a message on standard error.
struct Exit
{
    int status;
    QString message;
};

[[noreturn]] void usage(const QString &message)
{
    throw Exit{2, message + QStringLiteral("\n") + QString::fromLatin1(Usage).trimmed()};
}

[[noreturn]] void refuse(const QString &message)
{
    throw Exit{1, message};
}

bool onTerminal()
{
    return ::isatty(STDIN_FILENO) != 0;
}

QString buttonWord(Interaction::Button button, const QString &acceptText)
{
    switch (button) {
    case Interaction::Button::Ok:
        return QStringLiteral("ok");
    case Interaction::Button::Cancel:
        return QStringLiteral("cancel");
    case Interaction::Button::Yes:
        return QStringLiteral("yes");
    case Interaction::Button::No:
        return QStringLiteral("no");
    case Interaction::Button::Accept:
        return acceptText.isEmpty() ? QStringLiteral("accept") : acceptText.toLower();
    }
    return QString();
}

QString messageText(const Interaction::Message &message)
{
    QStringList parts;
    for (const QString &part : {message.title, message.text, message.informativeText, message.detailedText}) {
        if (!part.isEmpty())
            parts << part;
    }
    return parts.join(QLatin1Char('\n'));
}

// Messages go to standard error. A question is answered with the repair it
// offers under --yes, asked on the terminal when standard input is one, and
// otherwise ends the command before anything is written. A dry run answers
// as the real run would: its engine is read-only, and repairs that would
// change a directory at once only count as made.
class CtlInteraction : public Interaction
{
public:
    bool yes = false;

    void show(const Message &message) override
    {
        std::cerr << "ftpconfig-ctl: " << messageText(message).toLocal8Bit().constData() << std::endl;
    }
    Button ask(const Question &question) override
    {
        const QString text = messageText(question.message);
        if (yes) {
            for (const Button accepting : {Button::Accept, Button::Yes, Button::Ok}) {
                if (question.buttons.contains(accepting))
                    return accepting;
            }
            return question.defaultButton.value_or(question.buttons.value(0, Button::Ok));
        }
        if (!onTerminal())
            throw Exit{2, QStringLiteral("a question needs an answer (run with --yes to accept its repair):\n") + text};
        QStringList words;
        for (const Button button : question.buttons)
            words << buttonWord(button, question.acceptText);
        for (;;) {
            std::cerr << text.toLocal8Bit().constData() << "\n[" << words.join(QLatin1Char('/')).toStdString() << "] "
                      << std::flush;
            std::string line;
            if (!std::getline(std::cin, line))
                throw Exit{2, QStringLiteral("no answer to the question")};
            const QString answer = QString::fromLocal8Bit(line.c_str()).trimmed().toLower();
            for (int i = 0; i < words.size(); ++i) {
                if (!answer.isEmpty() && words[i].startsWith(answer))
                    return question.buttons[i];
            }
        }
    }
    std::optional<QString> chooseOwner(const QStringList &accounts) override
    {
        Question question;
        question.message.text = QStringLiteral("Give the directory to root?");
        question.buttons = {Button::Yes, Button::No};
        if (!accounts.contains(QStringLiteral("root")) || ask(question) != Button::Yes)
            return std::nullopt;
        return QStringLiteral("root");
    }
    std::optional<QString> askPath(const QString &label, const QString &initial) override
    {
        Question question;
        question.message.text = QStringLiteral("%1 %2").arg(label, initial);
        question.buttons = {Button::Ok, Button::Cancel};
        if (ask(question) != Button::Ok)
            return std::nullopt;
        return initial;
    }
    PamChoice askPamProblem() override
    {
        Question question;
        question.message.text = QStringLiteral("The PAM file does not let pam_userdb check virtual users. Fix it?");
        question.buttons = {Button::Yes, Button::No};
        return ask(question) == Button::Yes ? PamChoice::Fix : PamChoice::Skip;
    }
    [[noreturn]] void exitProcess(int status) override
    {
        throw ProcessExit{status};
    }
};

// One line from standard input, without echo on a terminal.
QByteArray readPassword()
{
    const bool terminal = onTerminal();
    termios saved{};
    if (terminal) {
        std::cerr << "Password: " << std::flush;
        ::tcgetattr(STDIN_FILENO, &saved);
        termios quiet = saved;
        quiet.c_lflag &= ~tcflag_t(ECHO);
        ::tcsetattr(STDIN_FILENO, TCSAFLUSH, &quiet);
    }
    std::string line;
    const bool read = static_cast<bool>(std::getline(std::cin, line));
    if (terminal) {
        ::tcsetattr(STDIN_FILENO, TCSAFLUSH, &saved);
        std::cerr << std::endl;
    }
    if (!read || line.empty())
        refuse(QStringLiteral("no password on standard input"));
    if (!line.empty() && line.back() == '\r')
        line.pop_back();
    return QByteArray::fromStdString(line);
}

// The rights words as the table shows them, separated by commas.
QString rightsArgument(const QString &argument)
{
    const AppStrings &strings = AppStrings::instance();
    const QStringList known{strings.fullAccess, strings.write, strings.download, strings.upload, strings.mkdir};
    QStringList rights;
    for (const QString &word : argument.split(QLatin1Char(','))) {
        const QString right = word.trimmed();
        if (!known.contains(right))
            refuse(
                QStringLiteral("\"%1\" is no right; the rights are: %2").arg(right, known.join(QStringLiteral(", "))));
        rights << right;
    }
    return rights.join(QStringLiteral(", "));
}

// A setting as vsftpd would read it from its own line.
void checkSetting(const QByteArray &key, const QByteArray &value)
{
    ConfigFile line(SyntaxMode::KeyValue);
    line.parseText((key + '=' + value + '\n').toStdString());
    const VsftpdSettings settings(line.elements);
    if (!settings.errors().isEmpty())
        refuse(settings.errors().first().message);
    if (VsftpdSettings::kindOf(key) == VsftpdSettings::Kind::Number) {
        bool number = false;
        value.toUInt(&number);
        if (!number)
            refuse(QStringLiteral("%1=\"%2\" is not a number").arg(QString::fromUtf8(key), QString::fromUtf8(value)));
    }
}

void checkUser(FtpServerConfig &config, const QByteArray &user)
{
    if (!config.accounts().accounts().count(user) && !config.isVirtualUser(user) && !config.isAnonymousUser(user))
        refuse(QStringLiteral("no user named %1").arg(QString::fromUtf8(user)));
}

void checkNewVirtualName(FtpServerConfig &config, const QByteArray &name)
{
    if (const auto reason = invalidNameReason(name))
        refuse(QStringLiteral("\"%1\" cannot be a user name: %2.").arg(QString::fromUtf8(name), *reason));
    if (config.accounts().livePassword(name))
        refuse(QStringLiteral("User %1 allready exists in users database.").arg(QString::fromUtf8(name)));
    if (config.accounts().accounts().count(name))
        refuse(QStringLiteral("A user named %1 exists already.").arg(QString::fromUtf8(name)));
}

void setStatus(FtpServerConfig &config, const QByteArray &user, bool allowed)
{
    checkUser(config, user);
    if (config.isAnonymousUser(user)) {
        config.setOption("anonymous_enable", allowed ? "yes" : "no");
        return;
    }
    AccessFailure failure;
    if (allowed && !config.checkAccess(user, true, &failure))
        refuse(QStringLiteral("Unable to change access status.\n%1").arg(failure.message));
    if (!allowed) {
        config.blockUserByUserlist(user);
        if (config.checkAccess(user, false, nullptr))
            refuse(QStringLiteral("Unable to change access status."));
    }
}

void setRoot(FtpServerConfig &config, const QByteArray &user, const QString &directory)
{
    checkUser(config, user);
    if (!directory.startsWith(QLatin1Char('/')))
        refuse(QStringLiteral("The directory must be an absolute path."));
    const QByteArray path = directory.toLocal8Bit();
    config.checkFolderPermissions(user, config.userRights(user), path);
    config.offerChroot(user, path);
    if (!config.setUserRoot(user, path))
        refuse(QStringLiteral("Unable to change the directory of %1.").arg(QString::fromUtf8(user)));
}

void setRights(FtpServerConfig &config, const QByteArray &user, const QString &argument)
{
    checkUser(config, user);
    const QString rights = rightsArgument(argument);
    config.checkFolderPermissions(user, rights.split(QStringLiteral(", ")));
    if (!config.setUserRights(user, rights))
        refuse(QStringLiteral("Unable to change user permissions."));
}

void printPlan(const FtpServerConfig::SavePlan &plan)
{
    const auto line = [](const QString &text) { std::printf("%s\n", text.toLocal8Bit().constData()); };
    const QString database = QString::fromUtf8(plan.virtualUsersPath);
    for (const QByteArray &name : plan.addedVirtualUsers)
        line(QStringLiteral("virtual user added to %1: %2").arg(database, QString::fromUtf8(name)));
    for (const auto &[name, previous] : plan.changedVirtualUsers) {
        if (previous.isEmpty())
            line(QStringLiteral("virtual user changed in %1: %2 (password)").arg(database, QString::fromUtf8(name)));
        else
            line(QStringLiteral("virtual user renamed in %1: %2 to %3")
                     .arg(database, QString::fromUtf8(previous), QString::fromUtf8(name)));
    }
    for (const QByteArray &name : plan.removedVirtualUsers)
        line(QStringLiteral("virtual user removed from %1: %2").arg(database, QString::fromUtf8(name)));
    for (const FtpServerConfig::PlannedFile &file : plan.files) {
        const QByteArray diff = file.diff();
        std::fwrite(diff.constData(), 1, static_cast<size_t>(diff.size()), stdout);
    }
}

struct Options
{
    QString root;
    bool yes = false;
    bool dryRun = false;
    bool json = false;
    QStringList command;
};

Options parseArguments(const QStringList &args)
{
    Options options;
    options.root = qEnvironmentVariable("FTPCONFIG_ROOT");
    for (int i = 0; i < args.size(); ++i) {
        const QString &arg = args[i];
        if (arg == QLatin1String("--yes") || arg == QLatin1String("-y"))
            options.yes = true;
        else if (arg == QLatin1String("--dry-run") || arg == QLatin1String("-n"))
            options.dryRun = true;
        else if (arg == QLatin1String("--json"))
            options.json = true;
        else if (arg == QLatin1String("--root") && i + 1 < args.size())
            options.root = args[++i];
        else if (arg.startsWith(QLatin1String("--root=")))
            options.root = arg.mid(7);
        else if (arg == QLatin1String("--help") || arg == QLatin1String("-h"))
            throw Exit{0, QString()};
        else if (arg.startsWith(QLatin1String("--password")))
            usage(QStringLiteral("a password is read from standard input, never from the command line"));
        else if (arg.startsWith(QLatin1Char('-')) && arg.size() > 1)
            usage(QStringLiteral("unknown option: %1").arg(arg));
        else
            options.command << arg;
    }
    if (options.root.isEmpty())
        options.root = QStringLiteral("/");
    return options;
}

// The number of arguments after the command's words.
void expectArguments(const QStringList &command, int words, int arguments)
{
    if (command.size() != words + arguments)
        usage(
            QStringLiteral("%1 takes %2 argument(s)").arg(command.mid(0, words).join(QLatin1Char(' '))).arg(arguments));
}

int list(const RootDirectory &root, bool json)
{
    ReportInteraction interaction;
    FtpServerConfig config(interaction, root, FtpServerConfig::Mode::ReadOnly);
    std::streambuf *out = std::cout.rdbuf(std::cerr.rdbuf());
    config.load();
    const Report report = buildReport(config, interaction);
    std::cout.rdbuf(out);
    printReport(report, root.path(), json, stdout);
    return 0;
}

int run(const Options &options)
{
    const QStringList &command = options.command;
    if (command.isEmpty())
        usage(QStringLiteral("no command"));
    const QFileInfo rootInfo(options.root);
    if (!rootInfo.isDir())
        usage(QStringLiteral("cannot use root %1: not a directory").arg(options.root));
    const RootDirectory root(QDir(options.root).absolutePath());
    const QString &verb = command[0];
    if (verb == QLatin1String("list")) {
        expectArguments(command, 1, 0);
        return list(root, options.json);
    }
    if (options.json)
        usage(QStringLiteral("--json is for list"));

    const bool isVuser = verb == QLatin1String("vuser");
    const QString sub = isVuser ? command.value(1) : QString();
    if (isVuser && sub != QLatin1String("add") && sub != QLatin1String("passwd") && sub != QLatin1String("del"))
        usage(QStringLiteral("vuser takes add, passwd or del"));
    if (isVuser && sub != QLatin1String("del") && command.size() > 3)
        usage(QStringLiteral("a password is read from standard input, never from the command line"));
    const QByteArray first = command.value(isVuser ? 2 : 1).toUtf8();

    CtlInteraction interaction;
    interaction.yes = options.yes;
    // The engine's chatter on standard output is a diagnostic here: standard
    // output carries the value of get and the diff of a dry run.
    std::cout.rdbuf(std::cerr.rdbuf());
    const bool reading = verb == QLatin1String("get");
    FtpServerConfig config(interaction, root,
                           reading || options.dryRun ? FtpServerConfig::Mode::ReadOnly
                                                     : FtpServerConfig::Mode::ReadWrite);
    if (reading) {
        expectArguments(command, 1, 1);
        if (VsftpdSettings::kindOf(first) == VsftpdSettings::Kind::Unknown)
            refuse(QStringLiteral("unknown setting \"%1\"").arg(QString::fromUtf8(first)));
        config.load();
        const VsftpdSettings settings(config.mainConfig().elements);
        if (!settings.contains(first))
            refuse(QStringLiteral("%1 is not set in %2")
                       .arg(QString::fromUtf8(first), AppStrings::instance().mainConfigPath));
        std::printf("%s\n", settings.value(first).constData());
        return 0;
    }
    // Refused before anything is loaded, let alone written.
    if (verb == QLatin1String("set")) {
        expectArguments(command, 1, 2);
        checkSetting(first, command[2].toUtf8());
    } else if (verb == QLatin1String("unset")) {
        expectArguments(command, 1, 1);
    } else if (verb == QLatin1String("allow") || verb == QLatin1String("deny")) {
        expectArguments(command, 1, 1);
    } else if (verb == QLatin1String("root") || verb == QLatin1String("rights")) {
        expectArguments(command, 1, 2);
    } else if (isVuser) {
        expectArguments(command, 2, 1);
    } else {
        usage(QStringLiteral("unknown command: %1").arg(verb));
    }
    const QByteArray password = isVuser && sub != QLatin1String("del") ? readPassword() : QByteArray();

    config.load();
    if (verb == QLatin1String("set")) {
        config.setOption(first, command[2].toUtf8());
        config.optionsChanged();
    } else if (verb == QLatin1String("unset")) {
        config.removeOption(first);
        config.optionsChanged();
    } else if (verb == QLatin1String("allow") || verb == QLatin1String("deny")) {
        setStatus(config, first, verb == QLatin1String("allow"));
    } else if (verb == QLatin1String("root")) {
        setRoot(config, first, command[2]);
    } else if (verb == QLatin1String("rights")) {
        setRights(config, first, command[2]);
    } else if (sub == QLatin1String("add")) {
        checkNewVirtualName(config, first);
        config.accounts().addVirtualUser(first, password);
    } else {
        if (!config.accounts().livePassword(first))
            refuse(QStringLiteral("Unable to find information about virtual user %1 in database.")
                       .arg(QString::fromUtf8(first)));
        if (sub == QLatin1String("del"))
            config.accounts().removeVirtualUser(first);
        else
            config.accounts().changeVirtualUser(first, first, password);
    }

    if (options.dryRun) {
        printPlan(config.planSave());
        return 0;
    }
    return config.save() ? 0 : 1;
}

} // namespace

int main(int argc, char **argv)
{
    QCoreApplication app(argc, argv);
    QCoreApplication::setApplicationName(QStringLiteral("ftpconfig"));
    std::streambuf *out = std::cout.rdbuf();
    int status = 0;
    try {
        status = run(parseArguments(QCoreApplication::arguments().mid(1)));
    } catch (const Exit &exit) {
        if (exit.status == 0 && exit.message.isEmpty())
            std::fputs(Usage, stdout);
        else
            std::cerr << "ftpconfig-ctl: " << exit.message.toLocal8Bit().constData() << std::endl;
        status = exit.status;
    } catch (const ProcessExit &exit) {
        status = exit.status & 0xff;
    } catch (const std::exception &e) {
        std::cerr << "ftpconfig-ctl: " << e.what() << std::endl;
        status = 1;
    }
    std::cout.rdbuf(out);
    std::fflush(stdout);
    return status;
}
