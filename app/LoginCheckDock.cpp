#include "LoginCheckDock.h"

#include "dialogs/ForecastIcons.h"
#include "dialogs/WrappingDelegate.h"
#include "forecast/LoginForecast.h"
#include "policy/AccessFailure.h"
#include "usertable/TreeModel.h"

#include <QApplication>
#include <QHeaderView>
#include <QStyle>
#include <QTreeWidget>

namespace {

QString location(const QString &file, int line)
{
    if (file.isEmpty() || line <= 0)
        return file;
    return file + QLatin1Char(':') + QString::number(line);
}

void setRow(QTreeWidgetItem *item, const QStringList &texts)
{
    for (int column = 0; column < texts.size(); ++column) {
        item->setText(column, texts.at(column));
        // Messages and paths run long; the whole text is one hover away.
        if (!texts.at(column).isEmpty())
            item->setToolTip(column, texts.at(column));
    }
}

} // namespace

LoginCheckDock::LoginCheckDock(QWidget *parent)
    : QDockWidget(tr("Login check"), parent)
{
    setObjectName(QStringLiteral("loginCheckDockWidget"));
    m_tree = new QTreeWidget(this);
    m_tree->setObjectName(QStringLiteral("findingsTreeWidget"));
    m_tree->setHeaderLabels({tr("Check"), tr("Result"), tr("Where"), tr("Message")});
    m_tree->setRootIsDecorated(true);
    WrappingDelegate::install(m_tree, MessageColumn);
    m_tree->setSelectionMode(QAbstractItemView::SingleSelection);
    m_tree->header()->setStretchLastSection(true);
    setWidget(m_tree);

    // Several signals of one edit make one refresh.
    m_refreshTimer.setSingleShot(true);
    m_refreshTimer.setInterval(0);
    connect(&m_refreshTimer, &QTimer::timeout, this, &LoginCheckDock::refresh);
}

void LoginCheckDock::setModel(TreeModel *model)
{
    if (m_model)
        disconnect(m_model, nullptr, this, nullptr);
    m_model = model;
    m_user = QPersistentModelIndex();
    m_userName.clear();
    m_groupName.clear();
    if (m_model) {
        connect(m_model, &TreeModel::engineChanged, this, &LoginCheckDock::scheduleRefresh);
        connect(m_model, &QAbstractItemModel::dataChanged, this, &LoginCheckDock::scheduleRefresh);
        connect(m_model, &QAbstractItemModel::modelReset, this, &LoginCheckDock::scheduleRefresh);
    }
    refresh();
}

void LoginCheckDock::showUser(const QModelIndex &sourceIndex)
{
    if (m_model && m_model->isUserRow(sourceIndex)) {
        m_user = sourceIndex.siblingAtColumn(TreeModel::UsersColumn);
        m_userName = m_model->userName(m_user);
        m_groupName = m_model->userName(m_user.parent());
    } else {
        m_user = QPersistentModelIndex();
        m_userName.clear();
        m_groupName.clear();
    }
    refresh();
}

QString LoginCheckDock::userName() const
{
    return m_userName;
}

QTreeWidget *LoginCheckDock::findingsTree() const
{
    return m_tree;
}

void LoginCheckDock::scheduleRefresh()
{
    m_refreshTimer.start();
}

QModelIndex LoginCheckDock::currentUserIndex()
{
    if (!m_model || m_userName.isEmpty())
        return {};
    if (m_user.isValid())
        return m_user;
    // Everybody holds the groups and the anonymous row.
    const QModelIndex everybody = m_model->index(0, 0);
    QModelIndex group = m_model->userName(everybody) == m_groupName ? everybody : QModelIndex();
    for (int row = 0; !group.isValid() && row < m_model->rowCount(everybody); ++row) {
        const QModelIndex candidate = m_model->index(row, 0, everybody);
        if (!m_model->isUserRow(candidate) && m_model->userName(candidate) == m_groupName)
            group = candidate;
    }
    for (int row = 0; group.isValid() && row < m_model->rowCount(group); ++row) {
        const QModelIndex candidate = m_model->index(row, 0, group);
        if (m_model->isUserRow(candidate) && m_model->userName(candidate) == m_userName) {
            m_user = candidate;
            return candidate;
        }
    }
    // Removed (a deleted virtual user, say): nothing left to show of it.
    m_userName.clear();
    m_groupName.clear();
    return {};
}

void LoginCheckDock::refresh()
{
    m_refreshTimer.stop();
    m_tree->clear();
    if (!m_model)
        return;
    addServerPart();
    const QModelIndex user = currentUserIndex();
    if (user.isValid()) {
        addUserPart(user);
    } else {
        auto *hint = new QTreeWidgetItem(m_tree);
        hint->setText(CheckColumn, tr("Select a user to see how their login ends."));
        hint->setFirstColumnSpanned(true);
        hint->setDisabled(true);
    }
    m_tree->expandAll();
    for (int column : {CheckColumn, ResultColumn, WhereColumn})
        m_tree->resizeColumnToContents(column);
}

void LoginCheckDock::addServerPart()
{
    const LoginForecast &forecast = m_model->loginForecast();
    auto *server = new QTreeWidgetItem(m_tree);
    const QList<ForecastFinding> &findings = forecast.serverFindings();
    QString summary;
    if (forecast.serverFails())
        summary = tr("vsftpd does not start or refuses every connection.");
    else if (findings.isEmpty())
        summary = tr("Nothing stops vsftpd before a login.");
    else
        summary = tr("vsftpd starts; notes on its configuration below.");
    setRow(server, {tr("Server"), forecast.serverFails() ? tr("fails") : tr("starts"), QString(), summary});
    server->setIcon(ResultColumn,
                    QApplication::style()->standardIcon(forecast.serverFails() ? QStyle::SP_MessageBoxCritical
                                                                               : QStyle::SP_DialogApplyButton));
    for (const ForecastFinding &finding : findings)
        addFinding(server, finding);
}

void LoginCheckDock::addUserPart(const QModelIndex &user)
{
    auto *top = new QTreeWidgetItem(m_tree);
    setRow(top, {m_model->userName(user)});
    top->setIcon(CheckColumn, m_model->data(user, Qt::DecorationRole).value<QIcon>());

    // The program's verdict, as the status column shows it.
    auto *verdict = new QTreeWidgetItem(top);
    const QString status = m_model->data(user.siblingAtColumn(TreeModel::StatusColumn)).toString();
    const AccessFailure failure = m_model->failure(user).value_or(AccessFailure());
    QString kind;
    if (failure.kind != FailureKind::None)
        kind = failureKindText(failure.kind);
    setRow(verdict, {tr("Program's verdict"), status, kind, failure.message});
    verdict->setIcon(ResultColumn, m_model->data(user, Qt::DecorationRole).value<QIcon>());

    // What vsftpd will do, with every finding that led there.
    auto *server = new QTreeWidgetItem(top);
    const UserForecast forecast = m_model->forecast(user).value_or(UserForecast());
    QString summary;
    if (forecast.findings.isEmpty())
        summary = tr("No findings.");
    setRow(server, {tr("Server forecast"), forecastStatusText(forecast.status), QString(), summary});
    server->setIcon(ResultColumn, forecastStatusIcon(forecast.status));
    for (const ForecastFinding &finding : forecast.findings)
        addFinding(server, finding);
}

QTreeWidgetItem *LoginCheckDock::addFinding(QTreeWidgetItem *parent, const ForecastFinding &finding)
{
    auto *item = new QTreeWidgetItem(parent);
    setRow(item, {QString(), severityText(finding.severity), location(finding.file, finding.line), finding.message});
    item->setIcon(ResultColumn, severityIcon(finding.severity));
    return item;
}
