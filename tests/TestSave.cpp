#include "CaptureStream.h"
#include "EngineFixture.h"
#include "Process.h"
#include "TestMain.h"
#include "common/SafeFile.h"
#include "policy/UnifiedDiff.h"

#include <QStandardPaths>
#include <QtTest>

#include <iostream>
#include <sys/stat.h>
#include <unistd.h>

namespace {

// Files an administrator may well have, with layout the model normalises
// when it prints: a save must leave them alone unless they changed.
FileMap richFiles()
{
    return {
        {QStringLiteral("/etc/vsftpd.conf"),
         "# Example config\nlisten=YES\n      local_enable=YES\nanon_root = /srv/ftp  \n"
         "userlist_file=/etc/vsftpd.d/allowed_user_list.conf\nchroot_list_enable=YES\n\n\n"},
        {QStringLiteral("/etc/vsftpd.d/allowed_user_list.conf"), "  carl  \n\nalice\n"},
        {QStringLiteral("/etc/vsftpd.chroot_list"), "bob \n"},
        {QStringLiteral("/etc/ftpusers"), "# deny\n      root\n"},
        {QStringLiteral("/etc/vsftpd.d/users.d/bob"), "# bob\n        local_root=/srv/bob\nwrite_enable=YES"},
        {QStringLiteral("/etc/vsftpd.d/users.d/alice"), "download_enable=NO\n"},
    };
}

// The files a save changed, without the backups it kept of them.
QStringList differences(const FileMap &before, const FileMap &after)
{
    QStringList changed;
    for (const QString &path : before.keys() + after.keys()) {
        if (!changed.contains(path) && !path.endsWith(QLatin1String(".ftpconfig-bak"))
            && before.value(path, "<absent>") != after.value(path, "<absent>"))
            changed << path;
    }
    changed.sort();
    return changed;
}

struct stat statOf(const QString &path)
{
    struct stat info
    {
    };
    ::lstat(QFile::encodeName(path).constData(), &info);
    return info;
}

} // namespace

class TestSave : public QObject
{
    Q_OBJECT

private slots:
    void initTestCase()
    {
        QStandardPaths::setTestModeEnabled(true);
    }

    void unchangedSave()
    {
        EngineFixture engine;
        QVERIFY(engine.load(richFiles()));
        const auto before = engine.root.files();
        QVERIFY(engine.config->save());
        const auto after = engine.root.files();
        // Only what a save changes on purpose: the userlist is always enabled,
        // before the trailing empty lines; a file that is written has its
        // indentation printed as tabs of four columns and spaces.
        QCOMPARE(differences(before, after), QStringList{QStringLiteral("/etc/vsftpd.conf")});
        QCOMPARE(after[QStringLiteral("/etc/vsftpd.conf")],
                 QByteArray("# Example config\nlisten=YES\n\t  local_enable=YES\nanon_root = "
                            "/srv/ftp  \nuserlist_file=/etc/vsftpd.d/allowed_user_list.conf\n"
                            "chroot_list_enable=YES\nuserlist_enable=yes\n\n\n"));
        QCOMPARE(engine.interaction.records.size(), 0);

        // Saving again changes nothing at all.
        QVERIFY(engine.config->save());
        QCOMPARE(differences(after, engine.root.files()), QStringList());
    }

    void changeSaveReload()
    {
        EngineFixture engine;
        FileMap files = richFiles();
        files.insert(QStringLiteral("/etc/pam.d/vsftpd"),
                     "auth sufficient pam_userdb.so db=/etc/vsftpd/virtual\n"
                     "account sufficient pam_userdb.so db=/etc/vsftpd/virtual\n"
                     "auth required pam_listfile.so item=user sense=deny file=/etc/ftpusers\n");
        QVERIFY(engine.load(files));
        const auto before = engine.root.files();
        FtpServerConfig &config = *engine.config;
        CaptureStream out(std::cout);
        QVERIFY(config.setUserRights("alice", QStringLiteral("write, download")));
        QVERIFY(config.checkFtpusers("root", true, nullptr));
        config.blockUserByUserlist("bob");
        config.setChrooted("alice");
        config.accounts().addVirtualUser("vera", "pw");
        config.accounts().changeVirtualUser("vic", "victor", {});
        const FtpServerConfig::SavePlan plan = config.planSave();
        QVERIFY(config.save());
        QCOMPARE(engine.interaction.records.size(), 0);

        // The plan is what the save then wrote, byte for byte, and each file
        // replaced is kept as it was; the database shows names only.
        const FileMap written = engine.root.files();
        QStringList planned{QStringLiteral("/etc/vsftpd/virtual.db")};
        for (const FtpServerConfig::PlannedFile &file : plan.files) {
            planned << file.path;
            QCOMPARE(written.value(file.path), file.next);
            QCOMPARE(file.current, before.value(file.path));
            QCOMPARE(file.exists, before.contains(file.path));
            QCOMPARE(written.value(file.path + QLatin1String(".ftpconfig-bak"), "<none>"),
                     file.exists ? file.current : QByteArray("<none>"));
        }
        planned.sort();
        QCOMPARE(
            planned,
            QStringLiteral("/etc/ftpusers /etc/vsftpd.chroot_list /etc/vsftpd.conf "
                           "/etc/vsftpd.d/allowed_user_list.conf /etc/vsftpd.d/users.d/alice /etc/vsftpd/virtual.db")
                .split(QLatin1Char(' ')));
        QCOMPARE(differences(before, written), planned);
        QCOMPARE(plan.virtualUsersPath, QByteArray("/etc/vsftpd/virtual.db"));
        QCOMPARE(plan.addedVirtualUsers, QList<QByteArray>{"vera"});
        QCOMPARE(plan.changedVirtualUsers, (QList<std::pair<QByteArray, QByteArray>>{{"victor", "vic"}}));
        QCOMPARE(written.value(QStringLiteral("/etc/vsftpd/virtual.db.ftpconfig-bak")),
                 before.value(QStringLiteral("/etc/vsftpd/virtual.db")));
        QCOMPARE(engine.root.readFile(QStringLiteral("/etc/vsftpd.d/allowed_user_list.conf")),
                 QByteArray("carl\nalice\nbob\n"));
        QCOMPARE(engine.root.readFile(QStringLiteral("/etc/vsftpd.chroot_list")), QByteArray("bob\nalice\n"));
        QCOMPARE(engine.root.readFile(QStringLiteral("/etc/ftpusers")), QByteArray("# deny\n"));
        QCOMPARE(engine.root.readFile(QStringLiteral("/etc/vsftpd.d/users.d/alice")),
                 QByteArray("download_enable=yes\nwrite_enable=yes\nanon_upload_enable=no\n\n"));

        const auto saved = engine.root.files();
        QVERIFY(engine.start());
        FtpServerConfig &again = *engine.config;
        QVERIFY(again.checkAccess("root", false) == false); // still a "*" in shadow, but no longer listed
        QVERIFY(!again.checkAccess("bob", false));
        AccessFailure failure;
        QVERIFY(!again.checkAccess("alice", false, &failure)); // listed in the black userlist
        QCOMPARE(failure.kind, FailureKind::UserlistFile);
        QVERIFY(again.isVirtualUser("vera"));
        QCOMPARE(::rightsText(again.userRights("alice")), QStringLiteral("write, download, mkdir"));
        QVERIFY(again.save());
        QCOMPARE(differences(saved, engine.root.files()), QStringList());
    }

    void saveIsStable_data()
    {
        QTest::addColumn<QString>("kind");
        QTest::addColumn<QByteArray>("content");
        QList<QPair<QString, QByteArray>> inputs;
        const QDir corpus(QStringLiteral(FTPCONFIG_TEST_DATA "/config-corpus"));
        for (const QString &name : corpus.entryList(QDir::Files)) {
            QFile file(corpus.filePath(name));
            QVERIFY(file.open(QIODevice::ReadOnly));
            inputs.append({name, file.readAll()});
        }
        // Debian's stock files, as the vsftpd package installs them.
        for (const char *stock : {"/etc/vsftpd.conf", "/etc/pam.d/vsftpd", "/etc/ftpusers"}) {
            QFile file(QString::fromLatin1(stock));
            if (file.open(QIODevice::ReadOnly))
                inputs.append({QString::fromLatin1(stock), file.readAll()});
        }
        for (const auto &[name, content] : inputs) {
            for (const char *kind : {"main", "pam", "userlist", "peruser"})
                QTest::addRow("%s %s", kind, qPrintable(name)) << QString::fromLatin1(kind) << content;
        }
    }

    // load, edit, save, load, edit the same place, save: the second file is the
    // first with only the edit changed, whatever the file held around it.
    void saveIsStable()
    {
        QFETCH(QString, kind);
        QFETCH(QByteArray, content);
        const QMap<QString, QString> files{
            {QStringLiteral("main"), QStringLiteral("/etc/vsftpd.conf")},
            {QStringLiteral("pam"), QStringLiteral("/etc/pam.d/vsftpd")},
            {QStringLiteral("userlist"), QStringLiteral("/etc/vsftpd.d/allowed_user_list.conf")},
            {QStringLiteral("peruser"), QStringLiteral("/etc/vsftpd.d/users.d/bob")}};
        FileMap input = richFiles();
        // The main file keeps naming the files the others are written to.
        if (kind == QLatin1String("main"))
            content = "pam_service_name=vsftpd\nuser_config_dir=/etc/vsftpd.d/users.d\n" + content;
        input[files[kind]] = content;

        const auto edit = [&](FtpServerConfig &config, const char *value) {
            if (kind == QLatin1String("main")) {
                setValue(config.mainConfig().elements, "", "ftpconfig_probe", value);
            } else if (kind == QLatin1String("peruser")) {
                setValue(config.userConfig("bob")->elements, "", "ftpconfig_probe", value);
            } else if (kind == QLatin1String("pam")) {
                auto line = findModuleLine(config.pamConfig().elements, "pam_probe.so");
                if (!line)
                    line = insertTokenLine(config.pamConfig().elements, {"auth", "optional", "pam_probe.so"},
                                           InsertAt::End);
                setTokenArgument(*line, "value", value);
            } else {
                config.userlist().removeAll(QStringLiteral("probe-a"));
                config.userlist().append(QStringLiteral("probe-") + QLatin1String(value));
            }
            config.setModified(true);
        };

        EngineFixture engine;
        CaptureStream out(std::cout);
        CaptureStream err(std::cerr);
        if (!engine.load(input))
            return; // a main file that names no usable PAM file: nothing to save
        edit(*engine.config, "a");
        engine.config->save();
        const QByteArray first = engine.root.readFile(files[kind]);
        QVERIFY(first.contains("probe") && first.contains('a'));

        QVERIFY(engine.start());
        edit(*engine.config, "b");
        engine.config->save();
        QByteArray expected = first;
        expected.replace(
            kind == QLatin1String("pam") ? "value=a" : (kind == QLatin1String("userlist") ? "probe-a" : "probe=a"),
            kind == QLatin1String("pam") ? "value=b" : (kind == QLatin1String("userlist") ? "probe-b" : "probe=b"));
        QCOMPARE(engine.root.readFile(files[kind]), expected);
    }

    void failures_data()
    {
        QTest::addColumn<QString>("damage");
        QTest::addColumn<QStringList>("texts");
        QTest::addColumn<QString>("written"); // a file that must still be saved

        const QString notDirectory = QStringLiteral("||cannot create a temporary file: Not a directory");
        QTest::newRow("PAM file gone") << QStringLiteral("pam")
                                       << QStringList{QStringLiteral(
                                              "Save PAM file|Unable to find vsftpd PAM config file (default is in "
                                              "/etc/pam.d/vsftpd).\nIt is neccesary for virtual users mechanism. "
                                              "Create it and re-run ftp config")}
                                       << QStringLiteral("/etc/vsftpd.d/allowed_user_list.conf");
        QTest::newRow("userlist directory impossible")
            << QStringLiteral("userlist")
            << QStringList{QStringLiteral("|Unable to create path /etc/blocked/sub. Server may not start."),
                           QStringLiteral("|Unable to save /etc/blocked/sub/list") + notDirectory}
            << QStringLiteral("/etc/vsftpd.chroot_list");
        QTest::newRow("per-user directory impossible")
            << QStringLiteral("userdir")
            << QStringList{QStringLiteral("|Unable to create path /etc/vsftpd.d/users.d/. Server may not start."),
                           QStringLiteral("|Unable to save /etc/vsftpd.d/users.d/bob") + notDirectory}
            << QStringLiteral("/etc/vsftpd.conf");
    }

    void failures()
    {
        QFETCH(QString, damage);
        QFETCH(QStringList, texts);
        QFETCH(QString, written);

        EngineFixture engine;
        QVERIFY(engine.load(richFiles()));
        CaptureStream out(std::cout);
        CaptureStream err(std::cerr);
        engine.config->userlist().append(QStringLiteral("dora"));
        engine.config->setChrooted("alice");
        QVERIFY(engine.config->setUserRoot("bob", "/srv/elsewhere"));
        if (damage == QLatin1String("pam")) {
            QVERIFY(QFile::remove(engine.root.filePath(QStringLiteral("/etc/pam.d/vsftpd"))));
        } else if (damage == QLatin1String("userlist")) {
            QVERIFY(engine.root.writeFile(QStringLiteral("/etc/blocked"), "a file where a directory should be"));
            setValue(engine.config->mainConfig().elements, "", "userlist_file", "/etc/blocked/sub/list");
            engine.config->userlist().append(QStringLiteral("erin"));
        } else {
            QDir(engine.root.filePath(QStringLiteral("/etc/vsftpd.d/users.d"))).removeRecursively();
            QVERIFY(engine.root.writeFile(QStringLiteral("/etc/vsftpd.d/users.d"), "a file"));
        }
        QVERIFY(!engine.config->save());
        QCOMPARE(engine.interaction.texts(), texts);
        QVERIFY2(engine.root.exists(written), qPrintable(written));
        // Whatever failed, the main configuration is written last all the same.
        QVERIFY(engine.root.readFile(QStringLiteral("/etc/vsftpd.conf")).contains("userlist_enable=yes\n"));
        if (damage == QLatin1String("userdir"))
            QVERIFY(QString::fromStdString(err.text())
                        .contains(QStringLiteral("Unable to create userconf dir: /etc/vsftpd.d/users.d/\n")));
    }

    void writerKeepsModeAndOwner()
    {
        FixtureRoot root;
        QVERIFY(root.writeFile(QStringLiteral("/etc/private.conf"), "old\n", 0640));
        const QString path = root.filePath(QStringLiteral("/etc/private.conf"));
        QCOMPARE(::chown(QFile::encodeName(path).constData(), 1000, 1001), 0);
        QVERIFY(!writeFileAtomically(path, "new\n"));
        const struct stat info = statOf(path);
        QCOMPARE(info.st_mode & 07777, 0640u);
        QCOMPARE(info.st_uid, 1000u);
        QCOMPARE(info.st_gid, 1001u);
        QCOMPARE(root.readFile(QStringLiteral("/etc/private.conf")), QByteArray("new\n"));
        // No temporary file is left behind, nor one an interrupted write left.
        QVERIFY(root.writeFile(QStringLiteral("/etc/.private.conf.ftpconfig-a1B2c3"), "torn"));
        QVERIFY(root.writeFile(QStringLiteral("/etc/.other.ftpconfig-a1B2c3"), "not ours to remove"));
        QVERIFY(!writeFileAtomically(path, "newer\n"));
        QCOMPARE(QDir(root.filePath(QStringLiteral("/etc"))).entryList(QDir::Files | QDir::Hidden),
                 (QStringList{QStringLiteral(".other.ftpconfig-a1B2c3"), QStringLiteral("private.conf")}));
        // A new file gets the mode asked for.
        QVERIFY(!writeFileAtomically(root.filePath(QStringLiteral("/etc/fresh")), "x", 0600));
        QCOMPARE(statOf(root.filePath(QStringLiteral("/etc/fresh"))).st_mode & 07777, 0600u);
        // A directory is not replaced, nor a file made where no directory is.
        QVERIFY(writeFileAtomically(root.filePath(QStringLiteral("/etc")), "x")
                    .value_or(QString())
                    .startsWith(QStringLiteral("the target is a directory")));
        QVERIFY(writeFileAtomically(root.filePath(QStringLiteral("/missing/dir/file")), "x")
                    .value_or(QString())
                    .startsWith(QStringLiteral("cannot create a temporary file")));
    }

    void writerFollowsOnlyRootsLinks_data()
    {
        QTest::addColumn<QString>("plant");
        QTest::addColumn<bool>("kept");
        // Administrators link the configuration from a repository: root's link
        // in root's directories is kept and its target written.
        QTest::newRow("root's link") << "" << true;
        QTest::newRow("link of another user") << "chown-link" << false;
        QTest::newRow("link in a directory others may write") << "open-dir" << false;
        QTest::newRow("target in a directory others may write") << "open-target-dir" << false;
        // The backup is written as carefully: a link another user put in its
        // place leads nowhere, and the file it would keep stays as it is.
        QTest::newRow("backup path a link of another user") << "chown-backup-link" << false;
    }

    void writerFollowsOnlyRootsLinks()
    {
        QFETCH(QString, plant);
        QFETCH(bool, kept);
        EngineFixture engine;
        QVERIFY(engine.load(richFiles()));
        QVERIFY(engine.root.writeFile(QStringLiteral("/srv/repo/vsftpd.conf"),
                                      engine.root.readFile(QStringLiteral("/etc/vsftpd.conf")), 0600));
        const QString link = engine.root.filePath(QStringLiteral("/etc/vsftpd.conf"));
        const QString target = engine.root.filePath(QStringLiteral("/srv/repo/vsftpd.conf"));
        QVERIFY(QFile::remove(link));
        QVERIFY(QFile::link(target, link));
        if (plant == QLatin1String("chown-link"))
            QCOMPARE(::lchown(QFile::encodeName(link).constData(), 1000, 1000), 0);
        if (plant == QLatin1String("open-dir"))
            QCOMPARE(::chmod(QFile::encodeName(engine.root.filePath(QStringLiteral("/etc"))).constData(), 0777), 0);
        if (plant == QLatin1String("open-target-dir"))
            QCOMPARE(::chmod(QFile::encodeName(engine.root.filePath(QStringLiteral("/srv/repo"))).constData(), 0775),
                     0);
        const QString backup = link + QLatin1String(".ftpconfig-bak");
        const QString victim = engine.root.filePath(QStringLiteral("/srv/victim"));
        if (plant == QLatin1String("chown-backup-link")) {
            QVERIFY(engine.root.writeFile(QStringLiteral("/srv/victim"), "victim\n"));
            QVERIFY(QFile::link(victim, backup));
            QCOMPARE(::lchown(QFile::encodeName(backup).constData(), 1000, 1000), 0);
        }
        const QByteArray before = engine.root.readFile(QStringLiteral("/srv/repo/vsftpd.conf"));

        setValue(engine.config->mainConfig().elements, "", "ftpd_banner", "changed");
        QCOMPARE(engine.config->save(), kept);
        QVERIFY(QFileInfo(link).isSymLink());
        QCOMPARE(statOf(target).st_mode & 07777, 0600u);
        if (kept) {
            QVERIFY(engine.root.readFile(QStringLiteral("/srv/repo/vsftpd.conf")).contains("ftpd_banner=changed"));
            QCOMPARE(engine.interaction.records.size(), 0);
            // Kept beside the link, with the mode of the file it leads to.
            QCOMPARE(engine.root.readFile(QStringLiteral("/etc/vsftpd.conf.ftpconfig-bak")), before);
            QCOMPARE(statOf(backup).st_mode & 07777, 0600u);
        } else {
            QCOMPARE(engine.root.readFile(QStringLiteral("/srv/repo/vsftpd.conf")), before);
            QCOMPARE(engine.root.readFile(QStringLiteral("/srv/victim")),
                     plant == QLatin1String("chown-backup-link") ? QByteArray("victim\n") : QByteArray());
            QCOMPARE(engine.interaction.records.size(), 1);
            QCOMPARE(engine.interaction.records[0].message.text, QStringLiteral("Unable to save /etc/vsftpd.conf"));
            QVERIFY(!engine.interaction.records[0].message.detailedText.isEmpty());
        }
    }

    void batchReportsEachFile()
    {
        // More files than the batch keeps open at once, one refused among them.
        FixtureRoot root;
        QVERIFY(root.makeDirectory(QStringLiteral("/etc/many/dir")));
        const QString dir = root.filePath(QStringLiteral("/etc/many"));
        AtomicBatch batch;
        for (int i = 0; i < 300; ++i)
            QVERIFY(!batch.add(dir + QStringLiteral("/f%1").arg(i), QByteArray::number(i)));
        QVERIFY(batch.add(dir + QStringLiteral("/dir"), "x"));
        QVERIFY(!batch.add(dir + QStringLiteral("/last"), "last"));
        const auto results = batch.commit();
        QCOMPARE(results.size(), std::size_t(302));
        QVERIFY(results[300].value_or(QString()).startsWith(QStringLiteral("the target is a directory")));
        QVERIFY(!results[299] && !results[301]);
        QCOMPARE(root.readFile(QStringLiteral("/etc/many/f299")), QByteArray("299"));
        QCOMPARE(QDir(dir).entryList(QDir::Files | QDir::Hidden).size(), 301);
        {
            // Dropped without a commit: nothing is written, nothing left behind.
            AtomicBatch dropped;
            QVERIFY(!dropped.add(dir + QStringLiteral("/f0"), "dropped"));
        }
        QCOMPARE(root.readFile(QStringLiteral("/etc/many/f0")), QByteArray("0"));
        QCOMPARE(QDir(dir).entryList(QDir::Files | QDir::Hidden).size(), 301);

        // A per-user file that cannot be written is reported alone; the others
        // are saved all the same.
        EngineFixture engine;
        QVERIFY(engine.load(richFiles()));
        const QString bob = engine.root.filePath(QStringLiteral("/etc/vsftpd.d/users.d/bob"));
        QVERIFY(engine.root.writeFile(QStringLiteral("/srv/bob.conf"), "local_root=/srv/bob\n"));
        QVERIFY(QFile::remove(bob));
        QVERIFY(QFile::link(engine.root.filePath(QStringLiteral("/srv/bob.conf")), bob));
        QCOMPARE(::lchown(QFile::encodeName(bob).constData(), 1000, 1000), 0);
        CaptureStream out(std::cout);
        QVERIFY(engine.config->setUserRoot("bob", "/srv/elsewhere"));
        QVERIFY(engine.config->setUserRights("alice", QStringLiteral("write, download")));
        QVERIFY(!engine.config->save());
        QCOMPARE(engine.interaction.records.size(), 1);
        QCOMPARE(engine.interaction.records[0].message.text,
                 QStringLiteral("Unable to save /etc/vsftpd.d/users.d/bob"));
        QVERIFY(engine.interaction.records[0].message.detailedText.contains(QStringLiteral("link")));
        QCOMPARE(engine.root.readFile(QStringLiteral("/srv/bob.conf")), QByteArray("local_root=/srv/bob\n"));
        QVERIFY(engine.root.readFile(QStringLiteral("/etc/vsftpd.d/users.d/alice")).contains("write_enable"));
    }

    void serverReadsTheProgramsUserlist()
    {
        // Debian's configuration names no userlist: once a save enables the
        // list, vsftpd must be told which file the program keeps, or it looks
        // for its own default, finds nothing and refuses every login.
        EngineFixture engine;
        QVERIFY(engine.load({{QStringLiteral("/etc/vsftpd.conf"), "listen=YES\nlocal_enable=YES\n"}}));
        QVERIFY(engine.config->save());
        QCOMPARE(engine.root.readFile(QStringLiteral("/etc/vsftpd.conf")),
                 QByteArray("listen=YES\nlocal_enable=YES\nuserlist_enable=yes\n"
                            "userlist_file=/etc/vsftpd.d/allowed_user_list.conf\n"));
        QVERIFY(engine.root.exists(QStringLiteral("/etc/vsftpd.d/allowed_user_list.conf")));
    }

    // What a save shows before it writes is the program's own diff: GNU diff
    // gives the same text where the shortest edit is unique, and patch turns
    // every one of them into the new file.
    void diffAsDiffWritesIt_data()
    {
        QTest::addColumn<QByteArray>("before");
        QTest::addColumn<QByteArray>("after");
        QTest::addColumn<bool>("sameAsGnu");

        QByteArray many;
        QByteArray shuffled;
        for (int i = 0; i < 5000; ++i) {
            many += "user" + QByteArray::number(i) + '\n';
            shuffled += "user" + QByteArray::number((i * 7919) % 5000) + '\n';
        }
        QTest::newRow("one line changed")
            << QByteArray("a\nb\nc\nd\ne\nf\ng\nh\n") << QByteArray("a\nb\nc\nd\nE\nf\ng\nh\n") << true;
        QTest::newRow("changes near and far")
            << QByteArray("1\n2\n3\n4\n5\n6\n7\n8\n9\n10\n11\n12\n13\n14\n15\n16\n17\n18\n19\n20\n")
            << QByteArray("0\n1\n2\n3\n4\n6\n7\n8\n9\n10\n11\n12\n13\n14\n15\n16\n17\n18\n19\n20\nend\n") << true;
        QTest::newRow("new file") << QByteArray() << QByteArray("listen=YES\n") << true;
        QTest::newRow("emptied") << QByteArray("a\nb\n") << QByteArray() << true;
        QTest::newRow("newline added at the end") << QByteArray("a\nb") << QByteArray("a\nb\n") << true;
        QTest::newRow("newline lost at the end") << QByteArray("a\nb\nc\n") << QByteArray("a\nb\nc") << true;
        QTest::newRow("line added after one without newline") << QByteArray("a") << QByteArray("a\nb") << true;
        QTest::newRow("name appended to a long list") << many << many + "bob\n" << true;
        QTest::newRow("beyond the edit limit") << many << shuffled << false;
    }

    void diffAsDiffWritesIt()
    {
        QFETCH(QByteArray, before);
        QFETCH(QByteArray, after);
        QFETCH(bool, sameAsGnu);

        const QByteArray diff = unifiedDiff(before, after, "a/etc/f", "b/etc/f");
        QCOMPARE(unifiedDiff(before, before, "a/etc/f", "b/etc/f"), QByteArray());
        QString why;
        const FileMap patched = patchedFiles({{QStringLiteral("/etc/f"), before}}, diff, why);
        QVERIFY2(why.isEmpty(), qPrintable(why + QString::fromUtf8(diff)));
        QCOMPARE(patched.value(QStringLiteral("/etc/f")), after);
        if (sameAsGnu) {
            QTemporaryDir dir;
            QFile a(dir.filePath(QStringLiteral("a")));
            QFile b(dir.filePath(QStringLiteral("b")));
            QVERIFY(a.open(QIODevice::WriteOnly) && a.write(before) == before.size() && b.open(QIODevice::WriteOnly)
                    && b.write(after) == after.size());
            a.close();
            b.close();
            const ProcessResult gnu
                = runProcess(QStringLiteral("diff"),
                             {QStringLiteral("-u"), QStringLiteral("--label"), QStringLiteral("a/etc/f"),
                              QStringLiteral("--label"), QStringLiteral("b/etc/f"), a.fileName(), b.fileName()});
            QCOMPARE(QString::fromUtf8(diff), QString::fromUtf8(gnu.out));
        }
    }
};

FTPCONFIG_TEST_GUILESS_MAIN(TestSave)

#include "TestSave.moc"
