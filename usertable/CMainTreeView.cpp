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
