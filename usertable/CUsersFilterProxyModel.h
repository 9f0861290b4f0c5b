#pragma once

#include <QSortFilterProxyModel>

// Hides system, denied or allowed users on request; group rows stay.
class CUsersFilterProxyModel : public QSortFilterProxyModel
{
    Q_OBJECT

public:
    explicit CUsersFilterProxyModel(QObject *parent = nullptr);

    void setHideSystemUsers(bool hide);
    void setHideDeniedUsers(bool hide);
    void setHideAllowedUsers(bool hide);
    bool hideSystemUsers() const;
    bool hideDeniedUsers() const;
    bool hideAllowedUsers() const;

protected:
    bool filterAcceptsRow(int sourceRow, const QModelIndex &sourceParent) const override;

private:
    bool m_hideSystem = false;
    bool m_hideDenied = false;
    bool m_hideAllowed = false;
};
