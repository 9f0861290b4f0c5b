#include "CMainWindow.h"

#include "LoginCheckDock.h"
#include "Server.h"
#include "VexHelpMenu.h"
#include "VexIcon.h"
#include "dialogs/GuiInteraction.h"
#include "dialogs/SavePreviewDialog.h"
#include "dialogs/TryLoginDialog.h"
#include "options/COptionsDialog.h"
#include "policy/FtpServerConfig.h"
#include "ui_CMainWindow.h"
#include "usertable/CDirSelectorDelegate.h"
#include "usertable/CMainTreeView.h"
#include "usertable/CPermissionDelegate.h"
#include "usertable/CUsermodeDelegate.h"
#include "usertable/CUsersFilterProxyModel.h"
#include "usertable/CreateVUserDialog.h"
#include "usertable/TreeModel.h"

#include <QCloseEvent>
#include <QCursor>
#include <QDebug>
#include <QDialogButtonBox>
#include <QHeaderView>
#include <QLabel>
#include <QLineEdit>
#include <QMenu>
#include <QMessageBox>
#include <QPixmap>
#include <QPushButton>
#include <QSettings>
#include <QStatusBar>

#include <cstdio>
#include <exception>
#include <optional>

namespace {

const QString widthKey = QStringLiteral("MW/width");
const QString heightKey = QStringLiteral("MW/height");
const QString toolbarsKey = QStringLiteral("MW/toolbars");
const QString toolbarOrientationKey = QStringLiteral("MW/toolbar_Orientation");
const QString treeHeaderStateKey = QStringLiteral("MW/treeHeaderState");

QIcon themeIcon(const char *name, const char *fallback)
{
    return QIcon::fromTheme(QLatin1String(name), QIcon(QPixmap(QLatin1String(fallback))));
}

QIcon startIcon()
{
    return themeIcon("media-playback-start", ":/prefix/icons/pixel/start.png");
}

QIcon stopIcon()
{
    return themeIcon("media-playback-stop", ":/prefix/icons/pixel/stop.png");
}

} // namespace

CMainWindow::CMainWindow(QWidget *parent)
    : CMainWindow(Server::instance(), parent)
{
}

CMainWindow::CMainWindow(Server &server, QWidget *parent)
    : QMainWindow(parent)
    , m_ui(std::make_unique<Ui::CMainWindow>())
    , m_server(server)
{
    try {
        build();
    } catch (const std::exception &error) {
        QMessageBox box(QMessageBox::Critical, windowTitle(), QString::fromLocal8Bit(error.what()), QMessageBox::Ok,
                        this);
        box.exec();
        close();
        // Start-up shows the window after this; it must not stay open
        // over a configuration it could not load.
        QMetaObject::invokeMethod(this, &QWidget::close, Qt::QueuedConnection);
    }
}

CMainWindow::~CMainWindow()
{
    // The model's engine talks through the interaction to the end: the
    // views and the model go first.
    if (m_view) {
        disconnect(m_view, nullptr, this, nullptr);
        m_view->setModel(nullptr);
    }
    delete m_loginCheckDock;
    delete m_proxy;
    delete m_model;
}

void CMainWindow::build()
{
    m_ui->setupUi(this);

    m_statusLabel
        = new QLabel(tr("There are unsaved changes. To apply them, click \"Save\" button on the toolbar"), this);
    m_statusLabel->setObjectName(QStringLiteral("unsavedChangesLabel"));
    m_statusLabel->setStyleSheet(QStringLiteral("font-weight: bold;"));
    m_statusLabel->hide();

    auto *helpMenu = new VexHelpMenu(this);
    menuBar()->addMenu(helpMenu);
    setActionIcons();

    // Made before the window state is restored, which places it.
    m_loginCheckDock = new LoginCheckDock(this);
    addDockWidget(Qt::BottomDockWidgetArea, m_loginCheckDock);
    auto *viewMenu = new QMenu(tr("View"), this);
    viewMenu->setObjectName(QStringLiteral("viewMenu"));
    viewMenu->addAction(m_loginCheckDock->toggleViewAction());
    menuBar()->insertMenu(helpMenu->menuAction(), viewMenu);

    restoreWindowState();

    const QStringList titles{tr("users"), tr("status"), tr("directory"), tr("mode"), tr("server")};
    m_interaction = std::make_unique<GuiInteraction>();
    m_model = new TreeModel(titles, *m_interaction, this);

    m_view = new CMainTreeView(this);
    setCentralWidget(m_view);
    m_proxy = new CUsersFilterProxyModel(this);
    m_proxy->setSourceModel(m_model);
    m_view->setModel(m_proxy);
    m_loginCheckDock->setModel(m_model);

    m_view->setContextMenuPolicy(Qt::CustomContextMenu);
    connect(m_view, &QWidget::customContextMenuRequested, this, &CMainWindow::contextMenuRequested);

    connect(m_ui->actionSave, &QAction::triggered, this, &CMainWindow::save);

    updateStartStopAction(m_server.running());
    connect(m_ui->actionStartStopService, &QAction::triggered, this, &CMainWindow::startStopService);
    connect(&m_server, &Server::runningChanged, this, &CMainWindow::updateStartStopAction);

    installDelegates();
    createFilterMenu();
    connectActions();

    m_view->expandAll();

    const QByteArray headerState = QSettings().value(treeHeaderStateKey).toByteArray();
    if (headerState.isEmpty()) {
        for (int column = 0; column < m_model->columnCount(); ++column)
            m_view->resizeColumnToContents(column);
        // First run: the table keeps the larger part of the window.
        resizeDocks({m_loginCheckDock}, {height() / 3}, Qt::Vertical);
    } else {
        m_view->header()->restoreState(headerState);
    }

    viewElementActivated(m_view->currentIndex());
    connect(m_model, &QAbstractItemModel::dataChanged, this, &CMainWindow::onDataChanged);
    // The saved state changes with every edit, including those that touch
    // no cell (a removal, the options).
    connect(m_model, &TreeModel::engineChanged, this, &CMainWindow::onDataChanged);
    onDataChanged();
    m_built = true;
}

void CMainWindow::setActionIcons()
{
    m_ui->actionStartStopService->setIcon(startIcon());
    m_ui->actionSave->setIcon(themeIcon("document-save", ":/prefix/icons/pixel/save.png"));
    m_ui->actionExit->setIcon(themeIcon("application-exit", ":/prefix/icons/exit.png"));
    m_ui->actionOptions->setIcon(themeIcon("configure", ":/prefix/icons/option_item.png"));
    m_ui->actionAdd_user->setIcon(themeIcon("list-add-user", ":/prefix/icons/pixel/adduser.png"));
    m_ui->actionDelete_user->setIcon(themeIcon("list-remove-user", ":/prefix/icons/pixel/deleteuser.png"));
    m_ui->actionEdit_user->setIcon(themeIcon("user-properties", ":/prefix/icons/pixel/edituser.png"));
    m_ui->actionTry_login->setIcon(themeIcon("dialog-password", ":/prefix/icons/pixel/trylogin.png"));
}

void CMainWindow::restoreWindowState()
{
    QSettings settings;
    resize(settings.value(widthKey, 640).toInt(), settings.value(heightKey, 480).toInt());
    const QByteArray state = settings.value(toolbarsKey).toByteArray();
    if (!state.isNull())
        restoreState(state, 0);
    const int orientation = settings.value(toolbarOrientationKey, int(Qt::Horizontal)).toInt();
    m_ui->toolBar->setOrientation(orientation == int(Qt::Vertical) ? Qt::Vertical : Qt::Horizontal);
}

void CMainWindow::installDelegates()
{
    m_view->setItemDelegateForColumn(TreeModel::StatusColumn, new CUsermodeDelegate(m_view));
    m_view->setItemDelegateForColumn(TreeModel::DirectoryColumn,
                                     new CDirSelectorDelegate(this, &m_model->config(), m_view));
    m_view->setItemDelegateForColumn(TreeModel::ModeColumn, new CPermissionDelegate(m_view));
}

void CMainWindow::createFilterMenu()
{
    m_filterMenu = new QMenu(tr("Filter users"), this);
    m_filterMenu->setObjectName(QStringLiteral("filterMenu"));

    m_hideSystemUsersAction
        = m_filterMenu->addAction(VexIcon::fromTheme(QStringLiteral("user"), QStringLiteral("emblem-system"),
                                                     QIcon(QPixmap(QStringLiteral(":/prefix/icons/user_gray.png")))),
                                  tr("Hide system users"));
    m_hideSystemUsersAction->setObjectName(QStringLiteral("hideSystemUsersAction"));
    m_hideSystemUsersAction->setCheckable(true);
    // Checked before it is connected: the proxy shows system users until
    // the item is toggled.
    m_hideSystemUsersAction->setChecked(true);
    connect(m_hideSystemUsersAction, &QAction::toggled, this, &CMainWindow::toggleSystemUsers);

    m_hideDeniedUsersAction
        = m_filterMenu->addAction(VexIcon::fromTheme(QStringLiteral("user"), QStringLiteral("emblem-unreadable"),
                                                     QIcon(QPixmap(QStringLiteral(":/prefix/icons/user_red.png")))),
                                  tr("Hide denied users"));
    m_hideDeniedUsersAction->setObjectName(QStringLiteral("hideDeniedUsersAction"));
    m_hideDeniedUsersAction->setCheckable(true);
    connect(m_hideDeniedUsersAction, &QAction::toggled, this, &CMainWindow::toggleDeniedUsers);

    m_hideAllowedUsersAction = m_filterMenu->addAction(
        QIcon::fromTheme(QStringLiteral("user"), QIcon(QPixmap(QStringLiteral(":/prefix/icons/user_green.png")))),
        tr("Hide allowed users"));
    m_hideAllowedUsersAction->setObjectName(QStringLiteral("hideAllowedUsersAction"));
    m_hideAllowedUsersAction->setCheckable(true);
    connect(m_hideAllowedUsersAction, &QAction::toggled, this, &CMainWindow::toggleAllowedUsers);

    m_filterMenu->addSeparator();
    m_filterMenu->addAction(m_ui->actionAdd_user);
    m_filterMenu->addAction(m_ui->actionEdit_user);
    m_filterMenu->addAction(m_ui->actionDelete_user);
    m_filterMenu->addAction(m_ui->actionTry_login);
}

void CMainWindow::connectActions()
{
    connect(m_ui->actionAdd_user, &QAction::triggered, this, &CMainWindow::addUser);
    connect(m_ui->actionDelete_user, &QAction::triggered, this, &CMainWindow::deleteUser);
    connect(m_ui->actionEdit_user, &QAction::triggered, this, &CMainWindow::editUser);
    connect(m_ui->actionTry_login, &QAction::triggered, this, &CMainWindow::tryLogin);
    connect(m_ui->actionExit, &QAction::triggered, this, &CMainWindow::exit);
    connect(m_ui->actionOptions, &QAction::triggered, this, &CMainWindow::showSettingsDialog);
    connect(m_view, &CMainTreeView::selected, this, &CMainWindow::viewElementActivated);
}

TreeModel *CMainWindow::model() const
{
    return m_model;
}

CUsersFilterProxyModel *CMainWindow::proxy() const
{
    return m_proxy;
}

CMainTreeView *CMainWindow::view() const
{
    return m_view;
}

LoginCheckDock *CMainWindow::loginCheckDock() const
{
    return m_loginCheckDock;
}

void CMainWindow::startStopService()
{
    const bool running = m_ui->actionStartStopService->data().toBool();
    if (running) {
        if (!m_server.stop()) {
            QMessageBox box(QMessageBox::NoIcon, windowTitle(),
                            tr("Failed to stop vsftpd.") + QLatin1Char('\n') + m_server.lastError(), QMessageBox::Ok,
                            this);
            box.exec();
        }
        return;
    }
    if (m_model && m_model->hasUnsavedChanges()) {
        const auto answer = QMessageBox::warning(
            this, windowTitle(), tr("You have unsaved changes. Do you want to save them before service start?"),
            QMessageBox::Yes | QMessageBox::No | QMessageBox::Cancel);
        if (answer == QMessageBox::Cancel)
            return;
        if (answer == QMessageBox::Yes && !save())
            return;
    }
    if (!m_server.start()) {
        QMessageBox box(QMessageBox::NoIcon, windowTitle(),
                        tr("Failed to start vsftpd.") + QLatin1Char('\n') + m_server.lastError(), QMessageBox::Ok,
                        this);
        box.exec();
    }
}

bool CMainWindow::save()
{
    FtpServerConfig::SavePlan plan = m_model->config().planSave();
    // An edit undone by hand leaves nothing to show: the save only
    // clears the unsaved state.
    if (!plan.files.empty() || !plan.virtualUsersPath.isEmpty()) {
        SavePreviewDialog preview(std::move(plan), this);
        if (preview.exec() != QDialog::Accepted)
            return false;
    }
    m_model->onSave();
    return true;
}

void CMainWindow::contextMenuRequested(const QPoint &pos)
{
    Q_UNUSED(pos)
    m_filterMenu->popup(QCursor::pos());
}

void CMainWindow::toggleSystemUsers(bool hide)
{
    refilterKeepingCurrent(&CUsersFilterProxyModel::setHideSystemUsers, hide);
}

void CMainWindow::toggleDeniedUsers(bool hide)
{
    refilterKeepingCurrent(&CUsersFilterProxyModel::setHideDeniedUsers, hide);
}

void CMainWindow::toggleAllowedUsers(bool hide)
{
    refilterKeepingCurrent(&CUsersFilterProxyModel::setHideAllowedUsers, hide);
}

void CMainWindow::refilterKeepingCurrent(void (CUsersFilterProxyModel::*setHidden)(bool), bool hide)
{
    const QPersistentModelIndex current = currentSourceIndex();
    m_model->evaluateAll();
    (m_proxy->*setHidden)(hide);
    m_view->expandGroups();
    m_view->setCurrentIndex(m_proxy->mapFromSource(current));
}

QModelIndex CMainWindow::currentSourceIndex() const
{
    return m_proxy->mapToSource(m_view->currentIndex());
}

bool CMainWindow::runVirtualUserDialog(CreateVUserDialog &dialog)
{
    for (QLineEdit *field : {dialog.nameLineEdit(), dialog.passwordLineEdit(), dialog.confirmationLineEdit()})
        connect(field, &QLineEdit::textEdited, this, &CMainWindow::enableVirtualUserOkButton);
    dialog.buttonBox()->button(QDialogButtonBox::Ok)->setEnabled(false);
    m_virtualUserButtonBox = dialog.buttonBox();
    const bool accepted = dialog.run();
    m_virtualUserButtonBox = nullptr;
    return accepted;
}

void CMainWindow::showVirtualUser(const QString &name)
{
    m_view->expandAll();
    m_view->setCurrentIndex(m_proxy->mapFromSource(m_model->indexOfUser(name)));
    viewElementActivated(m_view->currentIndex());
}

void CMainWindow::addUser()
{
    CreateVUserDialog dialog(this);
    if (!runVirtualUserDialog(dialog))
        return;
    const QByteArray name = dialog.userName().toUtf8();
    if (m_model->config().accounts().livePassword(name)) {
        QMessageBox::warning(this, windowTitle(),
                             tr("User %1 allready exists in users database.").arg(dialog.userName()));
        return;
    }
    if (refuseLocalName(name))
        return;
    m_model->addVirtualUser(name, dialog.password().toUtf8());
    showVirtualUser(dialog.userName());
}

bool CMainWindow::refuseLocalName(const QByteArray &name)
{
    // One name, two users: the table could not tell them apart, and which
    // password a login takes would depend on the PAM file's order. Renaming
    // in the table refuses it the same way.
    if (!m_model->config().accounts().accounts().count(name))
        return false;
    QMessageBox::warning(this, windowTitle(), tr("A user named %1 exists already.").arg(QString::fromUtf8(name)));
    return true;
}

void CMainWindow::editUser()
{
    const QModelIndex source = currentSourceIndex();
    // The shortcut reaches here whatever the row: only a virtual user is
    // edited.
    if (!m_model->isInVirtualGroup(source)) {
        QMessageBox::warning(this, windowTitle(), tr("Please, select virtual user which has to be changed."));
        return;
    }
    const QString oldName = m_model->userName(source);
    const auto oldPassword = m_model->config().accounts().livePassword(oldName.toUtf8());
    if (!oldPassword) {
        QMessageBox::warning(this, windowTitle(),
                             tr("Unable to find information about virtual user %1 in database.").arg(oldName));
        return;
    }
    CreateVUserDialog dialog(this);
    dialog.setUser(oldName, QString::fromUtf8(*oldPassword));
    if (!runVirtualUserDialog(dialog))
        return;
    const QByteArray name = dialog.userName().toUtf8();
    const QByteArray password = dialog.password().toUtf8();
    if (name == oldName.toUtf8() && password == *oldPassword)
        return;
    if (name != oldName.toUtf8() && m_model->config().accounts().livePassword(name)) {
        QMessageBox::warning(this, windowTitle(),
                             tr("User %1 allready exists in users database.").arg(dialog.userName()));
        return;
    }
    if (name != oldName.toUtf8() && refuseLocalName(name))
        return;
    // A new name moves the record: the save deletes the old key and writes
    // the new one.
    m_model->changeVirtualUser(oldName.toUtf8(), name, password);
    showVirtualUser(dialog.userName());
}

void CMainWindow::deleteUser()
{
    const QModelIndex current = m_view->currentIndex();
    auto *proxy = qobject_cast<QSortFilterProxyModel *>(m_view->model());
    if (current.isValid() && !proxy) {
        std::fputs("Internal error: view model is not proxy model.\n", stderr);
        return;
    }
    const QModelIndex source = current.isValid() ? proxy->mapToSource(current) : QModelIndex();
    // The shortcut reaches here whatever the row: only a virtual user goes.
    if (!m_model->isInVirtualGroup(source)) {
        QMessageBox::warning(this, windowTitle(), tr("Please, select virtual user which has to be changed."));
        return;
    }
    QMessageBox question(QMessageBox::Warning, tr("Deleting user"),
                         tr("Are you sure you want to delete virtual user %1?").arg(m_model->userName(source)),
                         QMessageBox::Ok | QMessageBox::Cancel, this);
    question.setDefaultButton(QMessageBox::Cancel);
    if (question.exec() == QMessageBox::Cancel)
        return;
    m_model->removeVirtualUser(source);
    m_view->expandAll();
    viewElementActivated(m_view->currentIndex());
}

void CMainWindow::tryLogin()
{
    const QModelIndex source = currentSourceIndex();
    // The shortcut reaches here whatever the row.
    if (!m_model->isUserRow(source))
        return;
    TryLoginDialog dialog(*m_model, source, this);
    dialog.exec();
}

void CMainWindow::viewElementActivated(const QModelIndex &index)
{
    const QModelIndex source = m_proxy->mapToSource(index);
    const QString name = m_model->userName(source);
    const bool virtualUser = source.isValid() && !m_model->isGroupName(name) && m_model->isInVirtualGroup(source)
        && m_model->config().isVirtualUser(name.toUtf8());
    m_ui->actionDelete_user->setVisible(virtualUser);
    m_ui->actionEdit_user->setVisible(virtualUser);
    m_ui->actionTry_login->setEnabled(m_model->isUserRow(source));
    m_loginCheckDock->showUser(source);
}

void CMainWindow::exit()
{
    close();
}

void CMainWindow::showSettingsDialog()
{
    COptionsDialog dialog(m_model->config(), this);
    dialog.load();
    if (dialog.exec() != QDialog::Accepted)
        return;
    dialog.save();
    m_model->config().optionsChanged();
    m_model->setUnsavedChanges(true);
    // Every verdict may change with the options: the rows are made again,
    // which the proxy filters anew.
    m_model->rebuild();
    m_view->expandAll();
    viewElementActivated(m_view->currentIndex());
    onDataChanged();
}

void CMainWindow::onDataChanged()
{
    const bool unsaved = m_model->hasUnsavedChanges();
    m_ui->actionSave->setEnabled(unsaved);
    if (unsaved) {
        statusBar()->addWidget(m_statusLabel);
        m_statusLabel->show();
    } else {
        statusBar()->removeWidget(m_statusLabel);
    }
}

void CMainWindow::enableVirtualUserOkButton()
{
    if (!m_virtualUserButtonBox)
        return;
    if (QPushButton *ok = m_virtualUserButtonBox->button(QDialogButtonBox::Ok))
        ok->setEnabled(true);
}

void CMainWindow::updateStartStopAction(bool running)
{
    qCritical() << "void CMainWindow::updateStartStopAction(bool)" << running;
    QAction *action = m_ui->actionStartStopService;
    action->setData(running);
    const QString text = running ? tr("Stop FTP service") : tr("Start FTP service");
    action->setIcon(running ? stopIcon() : startIcon());
    action->setText(text);
    action->setToolTip(text);
}

void CMainWindow::closeEvent(QCloseEvent *event)
{
    // Construction failed: there is nothing to save, and the window's
    // state is not worth keeping.
    if (!m_built) {
        event->accept();
        return;
    }
    if (m_model->hasUnsavedChanges()) {
        const auto answer = QMessageBox::question(this, windowTitle(), tr("Do you want to save changes?"),
                                                  QMessageBox::Yes | QMessageBox::No | QMessageBox::Cancel);
        if (answer == QMessageBox::Cancel) {
            event->ignore();
            return;
        }
        if (answer == QMessageBox::Yes && !save()) {
            event->ignore();
            return;
        }
        event->accept();
    } else {
        event->accept();
    }
    writeSettings();
}

void CMainWindow::writeSettings()
{
    QSettings settings;
    settings.setValue(widthKey, geometry().width());
    settings.setValue(heightKey, geometry().height());
    settings.setValue(toolbarsKey, saveState(0));
    settings.setValue(toolbarOrientationKey, int(m_ui->toolBar->orientation()));
    settings.setValue(treeHeaderStateKey, m_view->header()->saveState());
}
