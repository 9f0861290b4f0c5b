#include "VexIntegration.h"

#include <QCoreApplication>
#include <QSettings>
#include <QWidget>

namespace {

struct Identity
{
    QString version;
    QString description;
};

Identity &identity()
{
    static Identity theIdentity;
    return theIdentity;
}

QString geometryKey(const QWidget *widget, const QString &key)
{
    const QString name = key.isEmpty() ? QString::fromLatin1(widget->metaObject()->className()) : key;
    return QStringLiteral("geometry/") + name;
}

} // namespace

void vexInit(const char *version, const char *description)
{
    identity().version = QString::fromUtf8(version);
    identity().description = QString::fromUtf8(description);
    QCoreApplication::setOrganizationName(QStringLiteral("ftpconfig"));
    QCoreApplication::setApplicationName(QStringLiteral("ftpconfig"));
    QCoreApplication::setApplicationVersion(identity().version);
}

QString vexVersion()
{
    return identity().version;
}

QString vexDescription()
{
    return identity().description;
}

void vexSaveGeometry(const QWidget *widget, const QString &key)
{
    QSettings().setValue(geometryKey(widget, key), widget->saveGeometry());
}

bool vexRestoreGeometry(QWidget *widget, const QString &key)
{
    const QByteArray stored = QSettings().value(geometryKey(widget, key)).toByteArray();
    return !stored.isEmpty() && widget->restoreGeometry(stored);
}
