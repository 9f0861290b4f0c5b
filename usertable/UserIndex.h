#pragma once

#include "usertable/TreeModel.h"

#include <QAbstractProxyModel>
#include <QModelIndex>

// The users model and its index behind an index of the view, through any
// proxies between them; a null model when the index is not of a user row.
struct UserIndex
{
    TreeModel *model = nullptr;
    QModelIndex index;

    explicit UserIndex(QModelIndex viewIndex)
    {
        while (const auto *proxy = qobject_cast<const QAbstractProxyModel *>(viewIndex.model()))
            viewIndex = proxy->mapToSource(viewIndex);
        auto *tree = const_cast<TreeModel *>(qobject_cast<const TreeModel *>(viewIndex.model()));
        if (tree && tree->isUserRow(viewIndex)) {
            model = tree;
            index = viewIndex;
        }
    }

    // The name the engine knows the user by.
    QByteArray name() const
    {
        return model ? model->userName(index).toLocal8Bit() : QByteArray();
    }
};
