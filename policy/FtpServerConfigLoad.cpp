// Loading every file FtpServerConfig holds.
#include "FtpServerConfig.h"
#include "FtpServerConfigInternal.h"

#include "common/AppStrings.h"
#include "common/SafeFile.h"

#include <QDir>
#include <QFile>
#include <QFileInfo>

#include <fstream>
#include <iostream>
#include <sstream>

void FtpServerConfig::load()
{
    loadMainConfig();
    loadPamConfig();
    const QByteArray db = QByteArray::fromStdString(moduleArgument(m_pam.elements, "pam_userdb.so", "db"));
    if (db.isEmpty()) {
        const AppStrings &strings = AppStrings::instance();
        // Named as a db= argument would name the default file: the fix
        // writes it so, with the file's ".db" taken off.
        m_dbConfiguredPath = QFile::encodeName(strings.stateDirectory + QLatin1Char('/') + strings.virtualUsersDbName);
        if (m_dbConfiguredPath.endsWith(".db"))
            m_dbConfiguredPath.chop(3);
    } else {
        m_dbConfiguredPath = db;
    }
    // The file pam_userdb opens: ".db" appended whatever db= ends in.
    m_dbPath = m_dbConfiguredPath + ".db";
    loadUserlist();
    loadFtpusers();
    loadChrootList();
    loadUserConfigs();
    // Read-only, the document stays as the file is: the forecast judges
    // the file the server reads.
    if (m_mode == Mode::ReadWrite && !findData(m_main.elements, "", "listen")
        && !findData(m_main.elements, "", "listen_ipv6"))
        setValue(m_main.elements, "", "listen", "yes");
    loadVirtualUsers();
}

void FtpServerConfig::loadMainConfig()
{
    const QString path = AppStrings::instance().mainConfigPath;
    const QString file = m_root.resolve(path);
    const std::string shown = QFile::encodeName(path).toStdString();
    if (!QFileInfo::exists(file)) {
        m_mainConfigExisted = false;
        std::cout << shown << " not found" << std::endl;
        if (m_mode == Mode::ReadOnly) {
            m_main.parseText("listen=YES\n");
            return;
        }
        QFile created(file);
        if (!created.open(QIODevice::WriteOnly) || created.write("listen=YES\n") != 11) {
            m_interaction.critical(tr("Initialization error"), tr("Unable to create %1").arg(path));
            m_interaction.exitProcess(-1);
        }
    }
    std::ifstream in(QFile::encodeName(file).toStdString(), std::ios::in | std::ios::binary);
    if (!in.is_open() || QFileInfo(file).isDir()) {
        std::cout << shown << " could not be opened" << std::endl;
        m_interaction.critical(tr("Initialization error"), tr("Unable to open %1").arg(path));
        m_interaction.exitProcess(-1);
    }
    m_main.parse(in);
    remember(path, m_main);
}

void FtpServerConfig::loadPamConfig()
{
    m_pamServiceName = value("pam_service_name", "vsftpd");
    const QString path = AppStrings::instance().pamDirectory + text(m_pamServiceName);
    const QString file = m_root.resolve(path);
    if (!QFileInfo(file).isFile()) {
        std::cout << QFile::encodeName(path).constData() << " not found" << std::endl;
        m_pamConfigExisted = false;
        // Read-only, the files are judged as they are: Linux-PAM itself
        // goes on with /etc/pam.d/other, and the forecast says so.
        if (m_mode == Mode::ReadOnly)
            return;
        m_interaction.critical(tr("Initialization error"), tr("Unable to find %1").arg(path));
        m_interaction.exitProcess(-1);
    }
    std::ifstream in(QFile::encodeName(file).toStdString(), std::ios::in | std::ios::binary);
    m_pam.parse(in);
    remember(path, m_pam);
}

QStringList FtpServerConfig::readNameList(const QByteArray &path) const
{
    QStringList names;
    QFile file(resolved(path));
    if (!file.open(QIODevice::ReadOnly))
        return names;
    while (!file.atEnd()) {
        QByteArray line = file.readLine();
        if (line.endsWith('\n'))
            line.chop(1);
        // vsftpd compares whole lines: one that ends in "\r" names nobody,
        // and is kept as it is rather than simplified into a name.
        const QString name = line.endsWith('\r') ? QString::fromUtf8(line) : QString::fromUtf8(line).simplified();
        // An empty line names nobody; dropping it keeps the list's meaning.
        if (!name.isEmpty())
            names.append(name);
    }
    return names;
}

void FtpServerConfig::loadUserlist()
{
    m_userlistPath = configuredUserlistPath();
    m_userlist = NameList(readNameList(m_userlistPath));
    m_loadedText[text(m_userlistPath)] = nameListContent(m_userlist, m_userlistPath).toStdString();
}

void FtpServerConfig::loadFtpusers()
{
    const auto line = findModuleLine(m_pam.elements, "pam_listfile.so");
    if (!line)
        return;
    FtpusersRule rule;
    rule.item = QByteArray::fromStdString(tokenArgument(*line, "item"));
    rule.sense = QByteArray::fromStdString(tokenArgument(*line, "sense"));
    rule.file = QByteArray::fromStdString(tokenArgument(*line, "file"));
    rule.onerr = QByteArray::fromStdString(tokenArgument(*line, "onerr"));
    rule.apply = QByteArray::fromStdString(tokenArgument(*line, "apply"));
    m_ftpusersRule = rule;
    // A directory in the list's place is no list: reading it would throw.
    std::ifstream in(QFile::encodeName(resolved(rule.file)).toStdString(), std::ios::in | std::ios::binary);
    if (in.is_open() && QFileInfo(resolved(rule.file)).isFile()) {
        m_ftpusers.parse(in);
        remember(text(rule.file), m_ftpusers);
    }
}

void FtpServerConfig::loadChrootList()
{
    m_chrootListPath = configuredChrootListPath();
    m_chrootList = NameList(readNameList(m_chrootListPath));
    m_loadedText[text(m_chrootListPath)] = nameListContent(m_chrootList, m_chrootListPath).toStdString();
}

void FtpServerConfig::loadUserConfigs()
{
    m_userConfigDir = value("user_config_dir", DefaultListDirectory + "users.d/");
    if (!m_userConfigDir.endsWith('/'))
        m_userConfigDir += '/';
    const QString directory = resolved(m_userConfigDir);
    if (!QFileInfo(directory).isDir()) {
        if (m_mode == Mode::ReadWrite)
            QDir().mkpath(directory);
        return;
    }
    const QStringList names = QDir(directory).entryList(QDir::Files | QDir::Hidden, QDir::Name);
    for (const QString &name : names) {
        // Hidden files are editor backups or what an interrupted save left;
        // vsftpd looks a file up by the user's name, which is never such.
        if (invalidNameReason(QFile::encodeName(name)))
            continue;
        const QString file = QDir(directory).filePath(name);
        std::ifstream in(QFile::encodeName(file).toStdString(), std::ios::in | std::ios::binary);
        if (!in.is_open()) {
            std::cerr << "Unable to open " << (m_userConfigDir + QFile::encodeName(name)).constData() << std::endl;
            continue;
        }
        auto document = std::make_shared<ConfigFile>(SyntaxMode::KeyValue);
        document->parse(in);
        m_userConfigs.emplace(QFile::encodeName(name), document);
        remember(text(m_userConfigDir) + name, *document);
    }
}

void FtpServerConfig::loadVirtualUsers()
{
    const auto access = m_mode == Mode::ReadOnly ? AccountStore::Access::ReadOnly : AccountStore::Access::ReadWrite;
    m_accounts = std::make_unique<AccountStore>(QByteArray(), m_root, access);
    try {
        // As the PAM file writes it: the store appends ".db" as pam_userdb
        // does, and its recovery deletes the path as written, never the
        // file pam_userdb reads.
        m_accounts->loadVirtualUsers(m_dbConfiguredPath);
    } catch (const std::exception &e) {
        m_interaction.critical(tr("Error in creating database"),
                               tr("Unable lo load or create virtual user database.\nError message: ")
                                   + QString::fromLocal8Bit(e.what()));
    }
}

// Settings -----------------------------------------------------------------
