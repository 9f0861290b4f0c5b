#include "CMainTreeView.h"

CMainTreeView::CMainTreeView(QWidget *parent)
    : QTreeView(parent)
{
    setObjectName(QStringLiteral("usersTreeView"));
    setAlternatingRowColors(true);
    setUniformRowHeights(true);
    setEditTriggers(QAbstractItemView::DoubleClicked | QAbstractItemView::SelectedClicked
                    | QAbstractItemView::EditKeyPressed);
}

void CMainTreeView::currentChanged(const QModelIndex &current, const QModelIndex &previous)
{
    QTreeView::currentChanged(current, previous);
    emit selected(current);
}

void CMainTreeView::expandGroups(const QModelIndex &parent)
{
    const QAbstractItemModel *rows = model();
    if (!rows)
        return;
    const int count = rows->rowCount(parent);
    for (int row = 0; row < count; ++row) {
        const QModelIndex index = rows->index(row, 0, parent);
        if (!rows->hasChildren(index))
            continue;
        if (!isExpanded(index))
            expand(index);
        expandGroups(index);
    }
}
