#pragma once

#include <QPointer>
#include <QStyledItemDelegate>

class FtpServerConfig;

// The directory cell's editor: a path with a directory chooser. A missing
// directory is created, with the user's account as owner, once the operator
// agrees.
class CDirSelectorDelegate : public QStyledItemDelegate
{
    Q_OBJECT

public:
    CDirSelectorDelegate(QWidget *mainWindow, FtpServerConfig *config, QObject *parent = nullptr);

    QWidget *createEditor(QWidget *parent, const QStyleOptionViewItem &option, const QModelIndex &index) const override;
    void setEditorData(QWidget *editor, const QModelIndex &index) const override;
    void setModelData(QWidget *editor, QAbstractItemModel *model, const QModelIndex &index) const override;
    void updateEditorGeometry(QWidget *editor, const QStyleOptionViewItem &option,
                              const QModelIndex &index) const override;

private:
    void selectDirectory(QWidget *editor);
    QWidget *dialogParent() const;

    QPointer<QWidget> m_mainWindow;
    FtpServerConfig *m_config;
    // The directory last chosen in the chooser, as the administrator knows it.
    QString m_text;
};
