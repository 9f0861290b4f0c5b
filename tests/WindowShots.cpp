// Opens the main window on the root in FTPCONFIG_ROOT the way the program
// does, and saves pictures into the directory named on the command line:
// the window with a refused user selected, its filter menu, the refusal box
// of an edit that cannot be repaired, the PAM problem dialog over the
// window, the Login check dock, and the permissions editor.
#include "ModalHelper.h"
#include "app/CMainWindow.h"
#include "app/LoginCheckDock.h"
#include "app/VexIntegration.h"
#include "common/AppStrings.h"
#include "dialogs/GuiInteraction.h"
#include "usertable/CMainTreeView.h"
#include "usertable/CUsersFilterProxyModel.h"
#include "usertable/TreeModel.h"

#include <QApplication>
#include <QDir>
#include <QMenu>
#include <QPixmap>
#include <QTest>

#include <cstdio>

namespace {

QModelIndex userIndex(TreeModel &model, const QString &name, int column = TreeModel::UsersColumn)
{
    const QModelIndexList found
        = model.match(model.index(0, 0), Qt::DisplayRole, name, 1, Qt::MatchExactly | Qt::MatchRecursive);
    return found.isEmpty() ? QModelIndex() : found.first().siblingAtColumn(column);
}

} // namespace

int main(int argc, char **argv)
{
    QApplication app(argc, argv);
    const QStringList arguments = QApplication::arguments();
    if (arguments.size() < 2 || arguments.size() > 4) {
        std::fprintf(stderr, "usage: windowshots <output directory> [selected user] [user refused on edit]\n");
        return 2;
    }
    const QDir output(arguments.at(1));
    const QString selected = arguments.value(2, QStringLiteral("mallory"));
    const QString refused = arguments.value(3, QStringLiteral("mallory"));
    if (!QDir().mkpath(output.path())) {
        std::fprintf(stderr, "cannot create %s\n", qPrintable(output.path()));
        return 1;
    }
    QApplication::setWindowIcon(
        QIcon::fromTheme(QStringLiteral("ftp"), QIcon(QPixmap(QStringLiteral(":/prefix/icons/app-icon.png")))));
    vexInit("1.2.13", "Program to control FTP server VSFTPD");

    bool saved = true;
    const auto save = [&](QWidget *widget, const QString &name) {
        const QString file = output.filePath(name + QStringLiteral(".png"));
        if (!widget->grab().save(file)) {
            std::fprintf(stderr, "cannot write %s\n", qPrintable(file));
            saved = false;
        }
    };

    // The size of a first run, then one with room for the dock.
    CMainWindow window;
    window.show();
    if (!QTest::qWaitForWindowExposed(&window) || !window.model()) {
        std::fprintf(stderr, "the window did not come up\n");
        return 1;
    }
    TreeModel &model = *window.model();
    const QModelIndex user = window.proxy()->mapFromSource(userIndex(model, selected));
    if (!user.isValid()) {
        std::fprintf(stderr, "no user %s in the table\n", qPrintable(selected));
        return 1;
    }
    window.view()->setCurrentIndex(user);
    QTest::qWait(100);
    save(&window, QStringLiteral("window-first-run"));
    window.resize(960, 720);
    window.resizeDocks({window.loginCheckDock()}, {260}, Qt::Vertical);
    QTest::qWait(100);
    save(&window, QStringLiteral("window"));
    save(window.loginCheckDock(), QStringLiteral("login-check"));

    const auto menu = window.findChild<QMenu *>(QStringLiteral("filterMenu"));
    menu->popup(window.mapToGlobal(QPoint(200, 200)));
    QTest::qWait(100);
    save(menu, QStringLiteral("filter-menu"));
    menu->hide();

    // Every question the edit asks on the way is answered with its
    // refusing button; the refusal box is the picture.
    ModalHelper modal(10000);
    modal.expect(QStringLiteral("Unable to change access status."), [&](QWidget *box) {
        save(box, QStringLiteral("window-refusal-box"));
        ModalHelper::press(box, QStringLiteral("OK"));
    });
    model.setData(userIndex(model, refused, TreeModel::StatusColumn), QStringLiteral("allowed"));

    modal.expect(QStringLiteral("PAM configuration problem"), [&](QWidget *dialog) {
        save(dialog, QStringLiteral("window-pam-dialog"));
        ModalHelper::press(dialog, QStringLiteral("Skip"));
    });
    GuiInteraction().askPamProblem();

    // The mode cell's editor over the window, on the anonymous row.
    modal.expect(QStringLiteral("Dialog"), [&](QWidget *dialog) {
        save(dialog, QStringLiteral("permissions-editor"));
        ModalHelper::press(dialog, QStringLiteral("Cancel"));
    });
    window.view()->edit(
        window.proxy()->mapFromSource(userIndex(model, AppStrings::instance().anonymousUsers, TreeModel::ModeColumn)));

    if (!modal.done()) {
        std::fprintf(stderr, "%s\n", qPrintable(modal.report()));
        return 1;
    }
    return saved ? 0 : 1;
}
