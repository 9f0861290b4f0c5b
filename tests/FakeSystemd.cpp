// A stand-in for systemd on a private bus: it owns org.freedesktop.systemd1,
// knows the one unit vsftpd.service (or none with --no-unit), and moves the
// unit's ActiveState through the transitional states systemd announces.
// A control object at /control lets a test fail the next Start and send
// PropertiesChanged signals of its choice.
//   fakesystemd BUS-ADDRESS [--no-unit]
// Prints "ready" once the name is owned and every object is registered.
#include <QCoreApplication>
#include <QDBusConnection>
#include <QDBusContext>
#include <QDBusError>
#include <QDBusMessage>
#include <QDBusObjectPath>
#include <QVariantMap>

#include <cstdio>

namespace {

const QString unitInterfaceName = QStringLiteral("org.freedesktop.systemd1.Unit");
const QString unitPath = QStringLiteral("/org/freedesktop/systemd1/unit/vsftpd_2eservice");

} // namespace

class Unit : public QObject, protected QDBusContext
{
    Q_OBJECT
    Q_CLASSINFO("D-Bus Interface", "org.freedesktop.systemd1.Unit")
    Q_PROPERTY(QString ActiveState READ activeState)

public:
    explicit Unit(const QDBusConnection &bus)
        : m_bus(bus)
    {
    }

    QString activeState() const
    {
        return m_state;
    }

    void failNextStart(const QString &message)
    {
        m_startError = message;
    }

    // Sends PropertiesChanged for any interface; an empty state sends a
    // change without ActiveState. A state for the unit's interface is kept.
    void announce(const QString &interfaceName, const QString &state)
    {
        QVariantMap changed{{QStringLiteral("SubState"), QStringLiteral("dead")}};
        if (!state.isEmpty()) {
            changed.insert(QStringLiteral("ActiveState"), state);
            if (interfaceName == unitInterfaceName)
                m_state = state;
        }
        QDBusMessage signal = QDBusMessage::createSignal(unitPath, QStringLiteral("org.freedesktop.DBus.Properties"),
                                                         QStringLiteral("PropertiesChanged"));
        signal << interfaceName << changed << QStringList();
        m_bus.send(signal);
    }

public slots:
    QDBusObjectPath Start(const QString &mode)
    {
        if (!m_startError.isEmpty()) {
            sendErrorReply(QDBusError::Failed, m_startError);
            m_startError.clear();
            return {};
        }
        return job(mode, QStringLiteral("activating"), QStringLiteral("active"));
    }

    QDBusObjectPath Stop(const QString &mode)
    {
        return job(mode, QStringLiteral("deactivating"), QStringLiteral("inactive"));
    }

    QDBusObjectPath Reload(const QString &mode)
    {
        return job(mode, QStringLiteral("reloading"), QStringLiteral("active"));
    }

private:
    // Both states go out before the reply, so a caller that changed its
    // state from the reply instead of the signals would be caught.
    QDBusObjectPath job(const QString &mode, const QString &transitional, const QString &final)
    {
        if (mode != QLatin1String("replace")) {
            sendErrorReply(QDBusError::InvalidArgs, QStringLiteral("Job mode %1 invalid.").arg(mode));
            return {};
        }
        announce(unitInterfaceName, transitional);
        announce(unitInterfaceName, final);
        return QDBusObjectPath(QStringLiteral("/org/freedesktop/systemd1/job/%1").arg(++m_jobs));
    }

    QDBusConnection m_bus;
    QString m_state = QStringLiteral("inactive");
    QString m_startError;
    int m_jobs = 0;
};

class Manager : public QObject, protected QDBusContext
{
    Q_OBJECT
    Q_CLASSINFO("D-Bus Interface", "org.freedesktop.systemd1.Manager")

public:
    explicit Manager(bool unitLoaded)
        : m_unitLoaded(unitLoaded)
    {
    }

public slots:
    QDBusObjectPath GetUnit(const QString &name)
    {
        if (!m_unitLoaded || name != QLatin1String("vsftpd.service")) {
            sendErrorReply(QStringLiteral("org.freedesktop.systemd1.NoSuchUnit"),
                           QStringLiteral("Unit %1 not loaded.").arg(name));
            return {};
        }
        return QDBusObjectPath(unitPath);
    }

private:
    bool m_unitLoaded;
};

class Control : public QObject
{
    Q_OBJECT
    Q_CLASSINFO("D-Bus Interface", "local.ftpconfig.FakeSystemd")

public:
    explicit Control(Unit &unit)
        : m_unit(unit)
    {
    }

public slots:
    void FailNextStart(const QString &message)
    {
        m_unit.failNextStart(message);
    }

    void Announce(const QString &interfaceName, const QString &state)
    {
        m_unit.announce(interfaceName, state);
    }

private:
    Unit &m_unit;
};

int main(int argc, char **argv)
{
    QCoreApplication app(argc, argv);
    const QStringList arguments = app.arguments();
    if (arguments.size() < 2) {
        std::fputs("usage: fakesystemd BUS-ADDRESS [--no-unit]\n", stderr);
        return 2;
    }
    QDBusConnection bus = QDBusConnection::connectToBus(arguments.at(1), QStringLiteral("fakesystemd"));
    Unit unit(bus);
    Manager manager(!arguments.contains(QLatin1String("--no-unit")));
    Control control(unit);
    const auto exported = QDBusConnection::ExportAllSlots | QDBusConnection::ExportAllProperties;
    if (!bus.registerObject(QStringLiteral("/org/freedesktop/systemd1"), &manager, exported)
        || !bus.registerObject(unitPath, &unit, exported)
        || !bus.registerObject(QStringLiteral("/control"), &control, exported)
        || !bus.registerService(QStringLiteral("org.freedesktop.systemd1"))) {
        std::fprintf(stderr, "fakesystemd: %s\n", qPrintable(bus.lastError().message()));
        return 1;
    }
    std::puts("ready");
    std::fflush(stdout);
    return app.exec();
}

#include "FakeSystemd.moc"
