#pragma once

#include <QTreeView>

// The users tree of the main window. It announces the row the operator
// moves to, whether by mouse, keyboard or a filter that re-selects a row.
class CMainTreeView : public QTreeView
{
    Q_OBJECT

public:
    explicit CMainTreeView(QWidget *parent = nullptr);

    // Every row that has rows below it expanded: what expandAll() shows
    // here, where only groups hold rows, without laying out every user row
    // again when the groups are open already (a filter toggle).
    void expandGroups();

signals:
    void selected(const QModelIndex &index);

protected:
    void currentChanged(const QModelIndex &current, const QModelIndex &previous) override;

private:
    void expandGroups(const QModelIndex &parent, int depth);
};
