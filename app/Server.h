#pragma once

#include <QDBusConnection>
#include <QObject>
#include <QString>
#include <QStringList>
#include <QVariantMap>

class QDBusInterface;
class UnitPropertiesInterface;

// Starts, stops and watches vsftpd.service through systemd on the D-Bus.
// `running` follows the unit's ActiveState as systemd announces it; the
// operations only ask systemd for a job and never change it themselves.
class Server : public QObject
{
    Q_OBJECT
    Q_PROPERTY(bool running READ running NOTIFY runningChanged)

public:
    // The process-wide instance on the system bus, created on first use.
    static Server &instance();

    // Tests build their own instance on a bus of their choice.
    explicit Server(const QDBusConnection &bus, QObject *parent = nullptr);
    ~Server() override;

    bool running() const;
    // Each asks systemd for a job in mode "replace"; false (and lastError())
    // when the bus or systemd refuses, or when systemd had no such unit.
    bool start();
    bool stop();
    bool reload();
    // Message of the most recent failed call; empty until one fails.
    QString lastError() const;

signals:
    void runningChanged(bool running);

public slots:
    void unitPropertiesChanged(const QString &interfaceName, const QVariantMap &changedProperties,
                               const QStringList &invalidatedProperties);

private:
    bool callUnit(const QString &method);

    QDBusInterface *m_manager = nullptr;
    QDBusInterface *m_unit = nullptr;
    UnitPropertiesInterface *m_unitProperties = nullptr;
    bool m_running = false;
    // Why there is no unit to call, when GetUnit failed.
    QString m_unitError;
    QString m_lastError;
};
