// Runs "Try login" for one user through the dialog, on the files of the
// machine (the end-to-end test gives it a private /etc), and prints every
// row the dialog shows:
//   trylogindriver USER [PICTURE.png] < password
// One line a row: depth, step, result and reply, separated by tabs, the
// lines of a reply joined by " | ". Exits 0 when the trial ran to its end
// within the time allowed.
#include "dialogs/TryLoginDialog.h"
#include "report/AccessReport.h"
#include "usertable/TreeModel.h"

#include <QApplication>
#include <QLineEdit>
#include <QPushButton>
#include <QSignalSpy>
#include <QTreeWidget>

#include <cstdio>
#include <iostream>
#include <string>

namespace {

void print(const QTreeWidgetItem *item, int depth)
{
    QStringList fields{QString::number(depth)};
    for (int column = 0; column < item->columnCount(); ++column)
        fields << item->text(column).replace(QLatin1Char('\n'), QStringLiteral(" | "));
    std::cout << fields.join(QLatin1Char('\t')).toUtf8().constData() << '\n';
    for (int child = 0; child < item->childCount(); ++child)
        print(item->child(child), depth + 1);
}

} // namespace

int main(int argc, char **argv)
{
    QApplication app(argc, argv);
    QCoreApplication::setApplicationName(QStringLiteral("ftpconfig"));
    if (argc != 2 && argc != 3) {
        std::cerr << "usage: trylogindriver USER [PICTURE.png] < password\n";
        return 2;
    }
    std::string password;
    std::getline(std::cin, password);

    ReportInteraction interaction;
    TreeModel model({QStringLiteral("users"), QStringLiteral("status"), QStringLiteral("directory"),
                     QStringLiteral("mode"), QStringLiteral("server")},
                    interaction);
    const QModelIndex user = model.indexOfUser(QString::fromLocal8Bit(argv[1]));
    if (!model.isUserRow(user)) {
        std::cerr << "trylogindriver: no user " << argv[1] << '\n';
        return 2;
    }
    TryLoginDialog dialog(model, user);
    dialog.show();
    auto *field = dialog.findChild<QLineEdit *>(QStringLiteral("passwordLineEdit"));
    field->setText(QString::fromStdString(password));
    password.assign(password.size(), '\0');
    QSignalSpy finished(&dialog, &TryLoginDialog::trialFinished);
    dialog.findChild<QPushButton *>(QStringLiteral("tryPushButton"))->click();
    const bool ended = finished.wait(60000);
    // A picture of the dialog after a real trial, to look at.
    if (argc == 3 && !dialog.grab().save(QString::fromLocal8Bit(argv[2])))
        std::cerr << "trylogindriver: cannot write " << argv[2] << '\n';
    QTreeWidget *tree = dialog.stepsTree();
    for (int row = 0; row < tree->topLevelItemCount(); ++row)
        print(tree->topLevelItem(row), 0);
    dialog.reject();
    return ended ? 0 : 1;
}
