#include "Server.h"

#include <QDBusAbstractInterface>
#include <QDBusInterface>
#include <QDBusObjectPath>
#include <QDBusReply>

namespace {

const QString systemdService = QStringLiteral("org.freedesktop.systemd1");
const QString unitInterfaceName = QStringLiteral("org.freedesktop.systemd1.Unit");
const QString unitName = QStringLiteral("vsftpd.service");
const QString activeStateName = QStringLiteral("ActiveState");

} // namespace

// The unit's org.freedesktop.DBus.Properties interface. Connecting to its
// PropertiesChanged signal subscribes to that signal on the bus, from
// systemd and for the unit's path only.
class UnitPropertiesInterface : public QDBusAbstractInterface
{
    Q_OBJECT

public:
    UnitPropertiesInterface(const QString &path, const QDBusConnection &bus, QObject *parent)
        : QDBusAbstractInterface(systemdService, path, "org.freedesktop.DBus.Properties", bus, parent)
    {
    }

signals:
    void PropertiesChanged(const QString &interfaceName, const QVariantMap &changedProperties,
                           const QStringList &invalidatedProperties);
};

Server &Server::instance()
{
    static Server server(QDBusConnection::systemBus());
    return server;
}

Server::Server(const QDBusConnection &bus, QObject *parent)
    : QObject(parent)
{
    m_manager = new QDBusInterface(systemdService, QStringLiteral("/org/freedesktop/systemd1"),
                                   QStringLiteral("org.freedesktop.systemd1.Manager"), bus, this);
    const QDBusReply<QDBusObjectPath> unitPath = m_manager->call(QStringLiteral("GetUnit"), unitName);
    if (!unitPath.isValid()) {
        // Not loaded (vsftpd not installed, or no systemd): the unit counts as
        // stopped and every operation fails with this message. No interface
        // on the empty path: introspecting it aborts inside libdbus.
        m_unitError = unitPath.error().message();
        m_lastError = m_unitError;
        return;
    }
    const QString path = unitPath.value().path();
    m_unit = new QDBusInterface(systemdService, path, unitInterfaceName, bus, this);
    m_unitProperties = new UnitPropertiesInterface(path, bus, this);
    connect(m_unitProperties, &UnitPropertiesInterface::PropertiesChanged, this, &Server::unitPropertiesChanged);
    m_running = m_unit->property("ActiveState").toString() == QLatin1String("active");
}

Server::~Server() = default;

bool Server::running() const
{
    return m_running;
}

bool Server::start()
{
    return callUnit(QStringLiteral("Start"));
}

bool Server::stop()
{
    return callUnit(QStringLiteral("Stop"));
}

bool Server::reload()
{
    return callUnit(QStringLiteral("Reload"));
}

QString Server::lastError() const
{
    return m_lastError;
}

void Server::unitPropertiesChanged(const QString &interfaceName, const QVariantMap &changedProperties,
                                   const QStringList &invalidatedProperties)
{
    Q_UNUSED(invalidatedProperties)
    if (interfaceName != unitInterfaceName)
        return;
    const auto state = changedProperties.constFind(activeStateName);
    if (state == changedProperties.constEnd())
        return;
    // "activating", "deactivating", "reloading", "inactive" and "failed" all
    // count as not running.
    const bool running = state->toString() == QLatin1String("active");
    if (running == m_running)
        return;
    m_running = running;
    emit runningChanged(m_running);
}

bool Server::callUnit(const QString &method)
{
    if (!m_unit) {
        m_lastError = m_unitError;
        return false;
    }
    const QDBusReply<QDBusObjectPath> job = m_unit->call(method, QStringLiteral("replace"));
    if (job.isValid())
        return true;
    m_lastError = job.error().message();
    return false;
}

#include "Server.moc"
