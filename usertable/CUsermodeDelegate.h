#pragma once

#include <QStyledItemDelegate>

// The status cell's editor: a combo of "denied" and "allowed" whose choice
// takes effect at once.
class CUsermodeDelegate : public QStyledItemDelegate
{
    Q_OBJECT

public:
    explicit CUsermodeDelegate(QObject *parent = nullptr);

    QWidget *createEditor(QWidget *parent, const QStyleOptionViewItem &option, const QModelIndex &index) const override;
    void setEditorData(QWidget *editor, const QModelIndex &index) const override;
    void setModelData(QWidget *editor, QAbstractItemModel *model, const QModelIndex &index) const override;
    void updateEditorGeometry(QWidget *editor, const QStyleOptionViewItem &option,
                              const QModelIndex &index) const override;
};
