#include "CUsersFilterProxyModel.h"

#include "TreeModel.h"

CUsersFilterProxyModel::CUsersFilterProxyModel(QObject *parent)
    : QSortFilterProxyModel(parent)
{
}

void CUsersFilterProxyModel::setHideSystemUsers(bool hide)
{
    m_hideSystem = hide;
    invalidateFilter();
}

void CUsersFilterProxyModel::setHideDeniedUsers(bool hide)
{
    m_hideDenied = hide;
    invalidateFilter();
}

void CUsersFilterProxyModel::setHideAllowedUsers(bool hide)
{
    m_hideAllowed = hide;
    invalidateFilter();
}

bool CUsersFilterProxyModel::hideSystemUsers() const
{
    return m_hideSystem;
}

bool CUsersFilterProxyModel::hideDeniedUsers() const
{
    return m_hideDenied;
}

bool CUsersFilterProxyModel::hideAllowedUsers() const
{
    return m_hideAllowed;
}

bool CUsersFilterProxyModel::filterAcceptsRow(int sourceRow, const QModelIndex &sourceParent) const
{
    // Without a flag every row stays, and no user's access is evaluated
    // just to be shown: the table of a large system opens at once.
    if (!m_hideSystem && !m_hideDenied && !m_hideAllowed)
        return true;
    const QVariant flags = sourceModel()->index(sourceRow, 0, sourceParent).data(TreeModel::FilterRole);
    // Group rows have none and always stay.
    if (!flags.isValid())
        return true;
    if (m_hideSystem && (flags.toInt() & TreeModel::SystemUser))
        return false;
    return (flags.toInt() & TreeModel::AllowedUser) ? !m_hideAllowed : !m_hideDenied;
}
