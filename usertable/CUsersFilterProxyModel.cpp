#include "CUsersFilterProxyModel.h"

#include "accounts/AccountStore.h"
#include "common/AppStrings.h"
#include "policy/FtpServerConfig.h"

CUsersFilterProxyModel::CUsersFilterProxyModel(FtpServerConfig *config, QObject *parent)
    : QSortFilterProxyModel(parent)
    , m_config(config)
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
    const QAbstractItemModel *source = sourceModel();
    const QModelIndex nameIndex = source->index(sourceRow, 0, sourceParent);
    const QModelIndex statusIndex = source->index(sourceRow, 1, sourceParent);
    const auto status = [&] { return source->data(statusIndex).toString(); };
    // Group rows have no status and always stay.
    if (m_hideSystem && m_config && m_config->accounts().isSystemUser(source->data(nameIndex).toString().toUtf8())
        && !status().isEmpty())
        return false;
    if (!m_hideDenied && !m_hideAllowed)
        return true;
    const QString text = status();
    if (text.isEmpty())
        return true;
    const AppStrings &strings = AppStrings::instance();
    if (m_hideAllowed && text == strings.allowed)
        return false;
    if (m_hideDenied)
        return text != strings.denied;
    return true;
}
