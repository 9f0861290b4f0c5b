#pragma once

#include "FixtureRoot.h"
#include "TestStrings.h"
#include "app/CMainWindow.h"
#include "app/Server.h"
#include "usertable/CMainTreeView.h"
#include "usertable/CUsersFilterProxyModel.h"
#include "usertable/TreeModel.h"

#include <QAbstractItemModelTester>
#include <QAction>
#include <QApplication>
#include <QSettings>
#include <QTemporaryDir>
#include <QTest>

#include <memory>

// The main window as the program opens it, on a fixture root with the
// virtual users carol ("c") and dave ("d") in /etc/vsftpd/virtual.db, the
// settings in a temporary XDG_CONFIG_HOME, and a service whose bus is not
// connected, so that nothing on this machine is started. setUp() from
// initTestCase(), open() from init(), close() from cleanup().
struct WindowFixture
{
    static inline const QString virtualDb = QStringLiteral("/etc/vsftpd/virtual.db");

    bool setUp()
    {
        qputenv("XDG_CONFIG_HOME", QFile::encodeName(config.path()));
        QApplication::setQuitOnLastWindowClosed(false);
        server = std::make_unique<Server>(QDBusConnection(QStringLiteral("ftpconfig-no-bus")));
        return config.isValid() && QSettings().fileName().startsWith(config.path());
    }

    bool open()
    {
        QSettings().clear();
        root = std::make_unique<FixtureRoot>();
        const QByteArray userdb = "auth sufficient pam_userdb.so db=/etc/vsftpd/virtual\n"
                                  "account sufficient pam_userdb.so db=/etc/vsftpd/virtual\n";
        if (!root->write({{QStringLiteral("/etc/pam.d/vsftpd"),
                           userdb + FixtureRoot::defaults().value(QStringLiteral("/etc/pam.d/vsftpd"))}})
            || !root->writeVirtualUsers(virtualDb, {{"carol", "c"}, {"dave", "d"}}))
            return false;
        qputenv("FTPCONFIG_ROOT", QFile::encodeName(root->path()));
        window = std::make_unique<CMainWindow>(*server);
        if (!window->model())
            return false;
        tester = std::make_unique<QAbstractItemModelTester>(window->proxy(),
                                                            QAbstractItemModelTester::FailureReportingMode::QtTest);
        window->show();
        return QTest::qWaitForWindowExposed(window.get());
    }

    // The class of a top-level widget left behind, or nothing.
    QString close()
    {
        tester.reset();
        window.reset();
        root.reset();
        QCoreApplication::sendPostedEvents(nullptr, QEvent::DeferredDelete);
        const QWidgetList left = QApplication::topLevelWidgets();
        return left.isEmpty() ? QString() : QString::fromUtf8(left.first()->metaObject()->className());
    }

    // Any row by its text: users and groups.
    static QModelIndex find(const TreeModel &model, const QString &name, int column = TreeModel::UsersColumn)
    {
        const QModelIndexList found
            = model.match(model.index(0, 0), Qt::DisplayRole, name, 1, Qt::MatchExactly | Qt::MatchRecursive);
        return found.isEmpty() ? QModelIndex() : found.first().siblingAtColumn(column);
    }
    QModelIndex source(const QString &name, int column = TreeModel::UsersColumn) const
    {
        return find(*window->model(), name, column);
    }
    QModelIndex viewIndex(const QString &name, int column = TreeModel::UsersColumn) const
    {
        return window->proxy()->mapFromSource(source(name, column));
    }
    QString cell(const QString &name, int column) const
    {
        return source(name, column).data().toString();
    }
    // False when a named row is not shown; a null name clears the selection.
    bool select(const QString &name) const
    {
        const QModelIndex index = viewIndex(name);
        window->view()->setCurrentIndex(index);
        return name.isNull() || index.isValid();
    }
    bool setStatus(const QString &name, const QString &status) const
    {
        return window->model()->setData(source(name, TreeModel::StatusColumn), status);
    }
    QAction *action(const char *name) const
    {
        return window->findChild<QAction *>(QLatin1String(name));
    }

    QTemporaryDir config;
    std::unique_ptr<Server> server;
    std::unique_ptr<FixtureRoot> root;
    std::unique_ptr<CMainWindow> window;
    std::unique_ptr<QAbstractItemModelTester> tester;
};
