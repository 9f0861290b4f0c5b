#pragma once

#include <QIcon>
#include <QString>

class VexIcon
{
public:
    // The theme icon `name` with the theme icon `emblem` in its bottom-right
    // corner, at every size and mode it is drawn in. Without `name` in the
    // theme: the fallback; without `emblem`: the plain theme icon.
    static QIcon fromTheme(const QString &name, const QString &emblem, const QIcon &fallback = QIcon());
};
