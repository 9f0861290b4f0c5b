#include "CUsermodeDelegate.h"

#include "common/AppStrings.h"

#include <QComboBox>
#include <QIcon>

CUsermodeDelegate::CUsermodeDelegate(QObject *parent)
    : QStyledItemDelegate(parent)
{
}

QWidget *CUsermodeDelegate::createEditor(QWidget *parent, const QStyleOptionViewItem &, const QModelIndex &) const
{
    const AppStrings &strings = AppStrings::instance();
    auto *combo = new QComboBox(parent);
    combo->setObjectName(QStringLiteral("statusComboBox"));
    combo->setEditable(false);
    combo->addItem(QIcon(), strings.denied);
    combo->addItem(QIcon(), strings.allowed);
    // A choice changes the access at once; the operator need not leave the
    // cell first.
    connect(combo, QOverload<int>::of(&QComboBox::currentIndexChanged), this,
            [this, combo] { emit const_cast<CUsermodeDelegate *>(this)->commitData(combo); });
    return combo;
}

void CUsermodeDelegate::setEditorData(QWidget *editor, const QModelIndex &index) const
{
    auto *combo = static_cast<QComboBox *>(editor);
    const QSignalBlocker blocker(combo);
    combo->setCurrentIndex(index.data(Qt::EditRole).toString() == AppStrings::instance().denied ? 0 : 1);
}

void CUsermodeDelegate::setModelData(QWidget *editor, QAbstractItemModel *model, const QModelIndex &index) const
{
    model->setData(index, static_cast<QComboBox *>(editor)->currentText(), Qt::EditRole);
}

void CUsermodeDelegate::updateEditorGeometry(QWidget *editor, const QStyleOptionViewItem &option,
                                             const QModelIndex &) const
{
    editor->setGeometry(option.rect);
}
