#pragma once

#include <QDockWidget>
#include <QPersistentModelIndex>
#include <QPointer>
#include <QString>
#include <QTimer>

class QTreeWidget;
class QTreeWidgetItem;
class TreeModel;
struct ForecastFinding;

// "Login check": how a login of the selected user ends, twice over. The
// program's verdict with the file kind and message of a refusal, and the
// forecast of what vsftpd itself will do with every finding behind it;
// above both, what the server refuses before anybody logs in.
class LoginCheckDock : public QDockWidget
{
    Q_OBJECT

public:
    enum Column { CheckColumn = 0, ResultColumn, WhereColumn, MessageColumn };

    explicit LoginCheckDock(QWidget *parent = nullptr);

    // Follows the model's edits, rebuilds and saves from now on.
    void setModel(TreeModel *model);
    // The row of a user, or of a group (which leaves only the server part).
    void showUser(const QModelIndex &sourceIndex);
    // Empty when no user row is shown.
    QString userName() const;
    QTreeWidget *findingsTree() const;

public slots:
    void refresh();

private:
    void scheduleRefresh();
    QModelIndex currentUserIndex();
    void addServerPart();
    void addUserPart(const QModelIndex &user);
    QTreeWidgetItem *addFinding(QTreeWidgetItem *parent, const ForecastFinding &finding);

    QPointer<TreeModel> m_model;
    QTreeWidget *m_tree = nullptr;
    QTimer m_refreshTimer;
    // A rebuild of the model drops every index: the user is found again by
    // name within the same group.
    QPersistentModelIndex m_user;
    QString m_userName;
    QString m_groupName;
};
