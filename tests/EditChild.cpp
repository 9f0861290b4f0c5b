// Applies one administrator's edit through the engine and saves, answering
// every question with its accepting button: the end-to-end tests use it to
// change a root the way the program would and then ask the real server.
//   editchild --root DIR grant USER
//   editchild --root DIR deny USER
//   editchild --root DIR rights USER "write, download"
//   editchild --root DIR directory USER /srv/dir
//   editchild --root DIR vadd USER PASSWORD
//   editchild --root DIR vchange USER NEWNAME PASSWORD
//   editchild --root DIR vdelete USER
// The virtual user edits take the path of the window's dialogs: the account
// store changes in memory and the save writes the database.
#include "policy/FtpServerConfig.h"

#include <QCoreApplication>
#include <QStandardPaths>

#include <cstdio>
#include <iostream>

namespace {

class Accepting : public Interaction
{
public:
    void show(const Message &message) override
    {
        std::fprintf(stderr, "message: %s\n", qPrintable(message.text));
    }
    Button ask(const Question &question) override
    {
        std::fprintf(stderr, "question: %s\n", qPrintable(question.message.text));
        for (const Button accepting : {Button::Accept, Button::Yes, Button::Ok})
            if (question.buttons.contains(accepting))
                return accepting;
        return question.buttons.value(0, Button::Ok);
    }
    std::optional<QString> chooseOwner(const QStringList &) override
    {
        return QStringLiteral("root");
    }
    std::optional<QString> askPath(const QString &, const QString &initial) override
    {
        return initial;
    }
    PamChoice askPamProblem() override
    {
        return PamChoice::Valid;
    }
    [[noreturn]] void exitProcess(int status) override
    {
        throw ProcessExit{status};
    }
};

} // namespace

int main(int argc, char **argv)
{
    QCoreApplication app(argc, argv);
    QStandardPaths::setTestModeEnabled(true);
    const QStringList args = QCoreApplication::arguments();
    if (args.size() < 5 || args[1] != QLatin1String("--root")) {
        std::fputs("usage: editchild --root DIR grant|deny|rights|directory|vadd|vchange|vdelete USER [VALUE...]\n",
                   stderr);
        return 2;
    }
    const QString operation = args[3];
    const QByteArray user = args[4].toUtf8();
    const QString value = args.value(5);
    Accepting interaction;
    try {
        std::streambuf *out = std::cout.rdbuf(std::cerr.rdbuf());
        FtpServerConfig config(interaction, RootDirectory(args[2]));
        config.load();
        bool done = true;
        AccessFailure failure;
        if (operation == QLatin1String("grant")) {
            done = config.checkAccess(user, true, &failure);
        } else if (operation == QLatin1String("deny")) {
            config.blockUserByUserlist(user);
            done = !config.checkAccess(user, false);
        } else if (operation == QLatin1String("rights")) {
            config.checkFolderPermissions(user, value.split(QStringLiteral(", ")));
            done = config.setUserRights(user, value);
        } else if (operation == QLatin1String("directory")) {
            config.setUserRoot(user, value.toUtf8());
        } else if (operation == QLatin1String("vadd")) {
            config.accounts().addVirtualUser(user, value.toUtf8());
            done = config.isVirtualUser(user);
        } else if (operation == QLatin1String("vchange")) {
            config.accounts().changeVirtualUser(user, value.toUtf8(), args.value(6).toUtf8());
            done = config.isVirtualUser(value.toUtf8());
        } else if (operation == QLatin1String("vdelete")) {
            done = config.isVirtualUser(user);
            config.accounts().removeVirtualUser(user);
        } else {
            std::fputs("unknown operation\n", stderr);
            return 2;
        }
        const bool saved = config.save();
        std::cout.rdbuf(out);
        if (!done)
            std::fprintf(stderr, "not done: %s\n", qPrintable(failure.message));
        std::printf("%s %s\n", done ? "done" : "refused", saved ? "saved" : "save-failed");
        return done && saved ? 0 : 1;
    } catch (const ProcessExit &exit) {
        return exit.status & 0xff;
    }
}
