#pragma once

#include <QDialogButtonBox>
#include <QMainWindow>
#include <QModelIndex>
#include <QPointer>

#include <memory>

class CMainTreeView;
class CreateVUserDialog;
class CUsersFilterProxyModel;
class GuiInteraction;
class LoginCheckDock;
class QAction;
class QLabel;
class QMenu;
class Server;
class TreeModel;

namespace Ui {
class CMainWindow;
}

// The program's only window: the users table over the model that owns the
// engine, the actions that edit, save and drive vsftpd.service, the filter
// menu, and the window state kept between runs.
class CMainWindow : public QMainWindow
{
    Q_OBJECT

public:
    // The service is the process-wide Server on the system bus.
    explicit CMainWindow(QWidget *parent = nullptr);
    // The service is the given one (a private bus, or one that fails).
    explicit CMainWindow(Server &server, QWidget *parent = nullptr);
    ~CMainWindow() override;

    // Null when the model could not be built.
    TreeModel *model() const;
    CUsersFilterProxyModel *proxy() const;
    CMainTreeView *view() const;
    LoginCheckDock *loginCheckDock() const;

public slots:
    // Shows what the save will write and saves on the administrator's
    // word; false when it was cancelled.
    bool save();
    void startStopService();
    void contextMenuRequested(const QPoint &pos);
    void toggleSystemUsers(bool hide);
    void toggleDeniedUsers(bool hide);
    void toggleAllowedUsers(bool hide);
    void addUser();
    void deleteUser();
    void editUser();
    // Tries the selected user's password with PAM and the local server.
    void tryLogin();
    void viewElementActivated(const QModelIndex &index);
    void exit();
    void showSettingsDialog();
    void onDataChanged();
    void enableVirtualUserOkButton();
    void updateStartStopAction(bool running);

protected:
    void closeEvent(QCloseEvent *event) override;

private:
    void build();
    void setActionIcons();
    void restoreWindowState();
    void installDelegates();
    void createFilterMenu();
    void connectActions();
    void writeSettings();
    // Applies one filter flag and brings the current row back where it is
    // still shown.
    void refilterKeepingCurrent(void (CUsersFilterProxyModel::*setHidden)(bool), bool hide);
    QModelIndex currentSourceIndex() const;
    // Warns and returns true when a virtual user would take a local
    // account's name.
    bool refuseLocalName(const QByteArray &name);
    // Runs the virtual user dialog with its Ok button held back until the
    // first edit; true when it holds a name and password to store.
    bool runVirtualUserDialog(CreateVUserDialog &dialog);
    // Expands the table and makes the user's row the current one.
    void showVirtualUser(const QString &name);

    std::unique_ptr<Ui::CMainWindow> m_ui;
    Server &m_server;
    QLabel *m_statusLabel = nullptr;
    // Outlives the model, whose engine asks through it until the end.
    std::unique_ptr<GuiInteraction> m_interaction;
    TreeModel *m_model = nullptr;
    CUsersFilterProxyModel *m_proxy = nullptr;
    CMainTreeView *m_view = nullptr;
    LoginCheckDock *m_loginCheckDock = nullptr;
    QMenu *m_filterMenu = nullptr;
    QAction *m_hideSystemUsersAction = nullptr;
    QAction *m_hideDeniedUsersAction = nullptr;
    QAction *m_hideAllowedUsersAction = nullptr;
    // Every step of the construction went through.
    bool m_built = false;
    // The button box of the open virtual-user dialog, while one is open.
    QPointer<QDialogButtonBox> m_virtualUserButtonBox;
};
