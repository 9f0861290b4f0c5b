// The engine's verdicts, repairs and loading, over scenario tables in
// tests/data/scenarios: each row is a fixture root and what the engine must
// make of it.
#include "CaptureStream.h"
#include "EngineFixture.h"
#include "Scenario.h"
#include "TestMain.h"

#include <QSettings>
#include <QStandardPaths>
#include <QtTest>

#include <algorithm>
#include <iostream>
#include <sys/stat.h>
#include <unistd.h>

namespace {

const QString Refusal = QStringLiteral("***Result: FALSE. Check: ");

// "KIND TEXT" of a refusal as the tables write it; nothing when admitted.
void compareFailure(const AccessFailure &failure, const QString &refused)
{
    QCOMPARE(static_cast<int>(failure.kind), refused.section(QLatin1Char(' '), 0, 0).toInt());
    QCOMPARE(failure.message, refused.isEmpty() ? QString() : Refusal + refused.section(QLatin1Char(' '), 1));
}

QString join(const QStringList &list)
{
    return list.join(QLatin1Char(','));
}

QByteArray ftpusersText(const EngineFixture &engine)
{
    return QByteArray::fromStdString(engine.config->ftpusersList().text());
}

// Parts of the loaded state, "key=value;", as the loading table names them.
QString describeLoaded(FtpServerConfig &config)
{
    QStringList parts{QStringLiteral("userlist=") + join(config.userlist().names()),
                      QStringLiteral("chroot=") + join(config.chrootList().names()),
                      QStringLiteral("confdir=") + QString::fromUtf8(config.userConfigDir())};
    QStringList users;
    for (const auto &entry : config.userConfigs())
        users << QString::fromUtf8(entry.first);
    parts << QStringLiteral("userconfigs=") + join(users);
    const auto &rule = config.ftpusersRule();
    parts << QStringLiteral("rule=")
            + (rule ? QString::fromUtf8(rule->item + '/' + rule->sense + '/' + rule->file + '/' + rule->onerr + '/'
                                        + rule->apply)
                    : QStringLiteral("none"));
    parts << QStringLiteral("ftpusers=") + QString::fromStdString(config.ftpusersList().text());
    // The store must edit the file the save backs up (and pam_userdb opens).
    QString db = QStringLiteral("db=") + QString::fromUtf8(config.virtualUsersDbPath());
    const VirtualUserDb *store = config.accounts().database();
    if (store && store->filePath() != config.virtualUsersDbPath())
        db += QStringLiteral("!=") + QString::fromUtf8(store->filePath());
    parts << db;
    parts << QStringLiteral("main=") + QString::fromStdString(config.mainConfig().text());
    return parts.join(QLatin1Char(';')).replace(QLatin1Char('\n'), QLatin1Char('/')) + QLatin1Char(';');
}

} // namespace

class TestFtpServerConfig : public QObject
{
    Q_OBJECT

private slots:
    void initTestCase()
    {
        // The PAM check remembers "Valid" in the settings: keep them away from
        // the administrator's own.
        QStandardPaths::setTestModeEnabled(true);
        QCoreApplication::setApplicationName(QStringLiteral("ftpconfig-test"));
    }

    void init()
    {
        QSettings().clear();
    }

    void loading_data()
    {
        addScenarioRows(QStringLiteral("loading.txt"));
    }

    void loading()
    {
        QFETCH(Scenario, scenario);
        EngineFixture engine;
        engine.load(scenario);
        QCOMPARE(engine.exitStatus, scenario.value(QStringLiteral("status"), QStringLiteral("0")).toInt());
        if (scenario.has(QStringLiteral("stdout")))
            QCOMPARE(QString::fromStdString(engine.out), scenario.value(QStringLiteral("stdout")));
        QCOMPARE(engine.interaction.texts(), scenario.values(QStringLiteral("text")));
        if (scenario.has(QStringLiteral("conf-on-disk")))
            QCOMPARE(engine.root.readFile(QStringLiteral("/etc/vsftpd.conf")),
                     scenario.bytes(QStringLiteral("conf-on-disk")));
        if (engine.exitStatus != 0)
            return;
        QVERIFY(engine.root.exists(QString::fromUtf8(engine.config->userConfigDir())));
        const QString loaded = describeLoaded(*engine.config);
        for (const QString &part : scenario.values(QStringLiteral("loaded")))
            QVERIFY2(loaded.contains(part), qPrintable(loaded));
    }

    void verdicts_data()
    {
        addScenarioRows({QStringLiteral("verdicts.txt"), QStringLiteral("roots.txt")});
    }

    // The verdict without repair changes nothing and asks nobody; where the
    // row says what a repair leaves, the repair cures the refusal in memory.
    void verdicts()
    {
        QFETCH(Scenario, scenario);
        EngineFixture engine;
        QVERIFY(engine.load(scenario));
        FtpServerConfig &config = *engine.config;
        // One pass, as the report looks at users: the values read before a
        // repair must not hide it from the look after it.
        const FtpServerConfig::MetadataPass pass(config);
        const QByteArray user = scenario.bytes(QStringLiteral("user"));
        const QString refused = scenario.value(QStringLiteral("refused"));
        const QByteArray main = engine.mainText();
        const QStringList userlist = config.userlist().names();
        const QByteArray ftpusers = ftpusersText(engine);

        AccessFailure failure;
        QCOMPARE(config.checkAccess(user, false, &failure), refused.isEmpty());
        compareFailure(failure, refused);
        QCOMPARE(engine.mainText(), main);
        QVERIFY(!config.isModified());
        QCOMPARE(engine.interaction.records.size(), 0);
        if (scenario.has(QStringLiteral("root"))) {
            QCOMPARE(config.isChrooted(user), scenario.value(QStringLiteral("chrooted")) == QLatin1String("yes"));
            QCOMPARE(config.effectiveRoot(user), scenario.bytes(QStringLiteral("root")));
            QCOMPARE(config.ftpAccountName(user), scenario.bytes(QStringLiteral("ftp-account")));
        }
        const QStringList repairedKeys{QStringLiteral("repaired-main"), QStringLiteral("repaired-userlist"),
                                       QStringLiteral("repaired-ftpusers")};
        if (std::none_of(repairedKeys.begin(), repairedKeys.end(),
                         [&](const QString &key) { return scenario.has(key); }))
            return;

        AccessFailure repaired;
        QVERIFY(config.checkAccess(user, true, &repaired));
        QCOMPARE(repaired.message, QString());
        QVERIFY(config.isModified());
        QCOMPARE(engine.mainText(),
                 scenario.has(QStringLiteral("repaired-main")) ? scenario.bytes(QStringLiteral("repaired-main"))
                                                               : main);
        const QString userlistAfter = scenario.value(QStringLiteral("repaired-userlist"), join(userlist));
        QCOMPARE(join(config.userlist().names()), userlistAfter);
        QCOMPARE(config.userlistModified(), userlistAfter != join(userlist));
        QCOMPARE(ftpusersText(engine),
                 scenario.has(QStringLiteral("repaired-ftpusers")) ? scenario.bytes(QStringLiteral("repaired-ftpusers"))
                                                                   : ftpusers);
        QCOMPARE(engine.interaction.records.size(), 0);
        // Repaired in memory, so a second look in the same pass admits the
        // user; the disk is untouched until a save.
        QVERIFY(config.checkAccess(user, false));
        QCOMPARE(engine.root.readFile(QStringLiteral("/etc/vsftpd.conf")),
                 engine.files.value(QStringLiteral("/etc/vsftpd.conf")));
    }

    void rootRepairs_data()
    {
        addScenarioRows(QStringLiteral("root-repairs.txt"));
    }

    void rootRepairs()
    {
        QFETCH(Scenario, scenario);
        EngineFixture engine;
        QVERIFY(engine.load(scenario));
        const QString setup = scenario.value(QStringLiteral("setup"));
        const QByteArray srv = QFile::encodeName(engine.root.filePath(QStringLiteral("/srv/ftp")));
        if (setup == QLatin1String("owned"))
            QCOMPARE(::chown(srv.constData(), 107, 0), 0);
        if (setup == QLatin1String("groupwrite"))
            QCOMPARE(::chown(srv.constData(), 0, 2001) + ::chmod(srv.constData(), 0775), 0);
        QVERIFY(engine.interaction.script(scenario.values(QStringLiteral("answer"))));

        const QByteArray user = setup == QLatin1String("missing") ? "none" : "Anonymous users";
        const QString refused = scenario.value(QStringLiteral("refused"));
        AccessFailure failure;
        CaptureStream out(std::cout);
        // In one pass, as the report looks at users: what a look before the
        // repair read must not hide the repair from the look after it.
        const FtpServerConfig::MetadataPass pass(*engine.config);
        const bool before = engine.config->checkAccess(user, false);
        QCOMPARE(engine.config->checkAccess(user, true, &failure), refused.isEmpty());
        if (user == "Anonymous users" && !before)
            QCOMPARE(engine.config->checkAccess(user, false), refused.isEmpty());
        compareFailure(failure, refused);
        QCOMPARE(engine.interaction.texts(), scenario.values(QStringLiteral("text")));
        QVERIFY(engine.interaction.allAnswersUsed());
        QCOMPARE(engine.interaction.unexpected, 0);
        if (scenario.has(QStringLiteral("after"))) {
            struct stat info
            {
            };
            const QString path
                = setup == QLatin1String("missing") ? QStringLiteral("/home/none") : QStringLiteral("/srv/ftp");
            QCOMPARE(::stat(QFile::encodeName(engine.root.filePath(path)).constData(), &info), 0);
            QCOMPARE(QStringLiteral("%1:%2:%3").arg(info.st_uid).arg(info.st_gid).arg(info.st_mode & 0777, 0, 8),
                     scenario.value(QStringLiteral("after")));
        }
        if (setup == QLatin1String("owned") && refused.isEmpty()) {
            const QStringList offered = engine.interaction.records.constFirst().choices;
            QVERIFY(offered.contains(QStringLiteral("bob")) && offered.contains(QStringLiteral("root")));
        }
    }

    void blockUser_data()
    {
        addScenarioRows(QStringLiteral("block-user.txt"));
    }

    void blockUser()
    {
        QFETCH(Scenario, scenario);
        EngineFixture engine;
        QVERIFY(engine.load(scenario));
        QVERIFY(engine.interaction.script(scenario.values(QStringLiteral("answer"))));
        engine.config->blockUserByUserlist("bob");
        QCOMPARE(engine.mainText(), scenario.bytes(QStringLiteral("main")));
        const QString userlist = scenario.value(QStringLiteral("userlist"));
        QCOMPARE(join(engine.config->userlist().names()), userlist);
        QCOMPARE(engine.interaction.texts(), scenario.values(QStringLiteral("text")));
        QCOMPARE(engine.config->userlistModified(), userlist.contains(QLatin1String("bob")));
    }

    void pamUserdb_data()
    {
        addScenarioRows(QStringLiteral("pam-userdb.txt"));
    }

    void pamUserdb()
    {
        QFETCH(Scenario, scenario);
        const bool interactive = scenario.value(QStringLiteral("interactive")) != QLatin1String("no");
        const bool skipAfter = scenario.value(QStringLiteral("skip")) == QLatin1String("yes");
        const QByteArray pam = scenario.bytes(QStringLiteral("pam")) + '\n';
        EngineFixture engine;
        QVERIFY(engine.load({{QStringLiteral("/etc/pam.d/vsftpd"),
                              "auth sufficient pam_userdb.so db=/etc/vsftpd/virtual\n"
                              "account sufficient pam_userdb.so db=/etc/vsftpd/virtual\n"}}));
        // The database the fixture wrote is loaded; then the file under test.
        engine.config->pamConfig().parseText(pam.toStdString());
        QVERIFY(engine.interaction.script(scenario.values(QStringLiteral("answer"))));

        AccessFailure failure;
        QCOMPARE(engine.config->checkPamUserdb("vic", interactive, &failure),
                 scenario.value(QStringLiteral("result")) != QLatin1String("no"));
        if (scenario.has(QStringLiteral("kind")))
            compareFailure(failure,
                           scenario.value(QStringLiteral("kind"))
                               + QStringLiteral(" in vsftpd PAM file module pam_userdb.so contains invalid path "
                                                "to virtual user db file."));
        else
            QCOMPARE(failure.kind, FailureKind::None);
        const QByteArray after = scenario.has(QStringLiteral("pam-after"))
            ? scenario.bytes(QStringLiteral("pam-after")).replace("{module}", FtpServerConfig::pamUserdbModule()) + '\n'
            : pam;
        QCOMPARE(QByteArray::fromStdString(engine.config->pamConfig().text()), after);
        QCOMPARE(engine.interaction.texts(), scenario.values(QStringLiteral("text")));
        if (scenario.has(QStringLiteral("initial"))) {
            QStringList offered;
            for (const auto &record : engine.interaction.records) {
                if (record.kind == QLatin1String("path"))
                    offered << record.choices.value(1);
            }
            QCOMPARE(offered, scenario.values(QStringLiteral("initial")));
        }
        QVERIFY(engine.interaction.allAnswersUsed());
        QCOMPARE(QSettings().value(QStringLiteral("skip_pam_check"), false).toBool(), skipAfter);
        // Local users are never looked at.
        QVERIFY(engine.config->checkPamUserdb("bob", interactive, nullptr));
        // Valid never asks again; Skip, or a fix not made, asks no more in this run.
        const bool asked = !scenario.values(QStringLiteral("answer")).filter(QStringLiteral("pam:")).isEmpty();
        if (skipAfter || (asked && scenario.value(QStringLiteral("result")) == QLatin1String("no"))) {
            const int shown = engine.interaction.records.size();
            QCOMPARE(engine.config->checkPamUserdb("vic", true, nullptr), skipAfter);
            QCOMPARE(engine.interaction.records.size(), shown);
        }
    }

    void failureDialog()
    {
        ScriptedInteraction interaction;
        showFailureDialog(interaction, {FailureKind::UserlistFile, QStringLiteral("why")});
        showFailureDialog(interaction, {FailureKind::Filesystem, QStringLiteral("where")});
        QCOMPARE(interaction.texts(),
                 (QStringList{QStringLiteral("|why|Failure classification: FTP userlist file"),
                              QStringLiteral("|where|Failure classification: filesystem permissions")}));
        QCOMPARE(interaction.records.constFirst().message.icon, Interaction::Icon::Critical);
    }

    // The options dialog's edits: a set or a removal marks the configuration
    // modified, a removal of nothing does not; a new chroot list is read once
    // the options are applied.
    void options()
    {
        EngineFixture engine;
        QVERIFY(
            engine.load({{QStringLiteral("/etc/vsftpd.conf"), "listen=YES\nlocal_enable=YES\nchroot_list_enable=YES\n"},
                         {QStringLiteral("/etc/other.chroot_list"), "bob\n"}}));
        FtpServerConfig &config = *engine.config;
        config.setModified(false);
        config.removeOption("chroot_local_user");
        QVERIFY(!config.isModified());
        QVERIFY(!config.isChrooted("bob"));
        config.setOption("chroot_list_file", "/etc/other.chroot_list");
        QVERIFY(config.isModified());
        config.optionsChanged();
        QVERIFY(config.isChrooted("bob"));
        QVERIFY(!config.isChrooted("alice"));
        config.setModified(false);
        config.removeOption("chroot_list_file");
        QVERIFY(config.isModified());
        config.optionsChanged();
        QVERIFY(!config.isChrooted("bob"));
    }
};

FTPCONFIG_TEST_GUILESS_MAIN(TestFtpServerConfig)

#include "TestFtpServerConfig.moc"
