#pragma once

#include <QStyledItemDelegate>

// The mode cell's editor: the permissions editor dialog instead of an inline
// editor. The chosen rights go to the model, the chosen bits to the user's
// FTP root.
class CPermissionDelegate : public QStyledItemDelegate
{
    Q_OBJECT

public:
    explicit CPermissionDelegate(QObject *parent = nullptr);

    QWidget *createEditor(QWidget *parent, const QStyleOptionViewItem &option, const QModelIndex &index) const override;
    void updateEditorGeometry(QWidget *editor, const QStyleOptionViewItem &option,
                              const QModelIndex &index) const override;
};
