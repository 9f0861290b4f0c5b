#include "VirtualUserDb.h"

#include "common/AppStrings.h"

#include <QCoreApplication>
#include <QDateTime>
#include <QDir>
#include <QFile>
#include <QFileInfo>

#include <db_cxx.h>

#include <cerrno>
#include <cstring>
#include <iostream>
#include <stdexcept>
#include <sys/stat.h>

namespace {

static_assert(VirtualUserDb::EnvironmentFlags == (DB_CREATE | DB_RECOVER | DB_INIT_MPOOL | DB_INIT_TXN));
static_assert(VirtualUserDb::OpenFlags == (DB_CREATE | DB_AUTO_COMMIT | DB_READ_UNCOMMITTED));

constexpr int PrivateMode = 0600;

Dbt bytes(const QByteArray &data)
{
    // Berkeley DB does not write through the pointer of a key or data Dbt
    // passed to put or del.
    return Dbt(const_cast<char *>(data.constData()), static_cast<u_int32_t>(data.size()));
}

// A hash file names its last page in its meta page; a file shorter than
// that lost pages, and Berkeley DB would read the missing ones as empty.
// Throws when the file is such a torn copy.
void checkNotTruncated(const QString &path)
{
    QFile file(path);
    if (!file.open(QIODevice::ReadOnly))
        return;
    const QByteArray meta = file.read(36);
    if (meta.size() < 36)
        return;
    const auto word = [&](int offset, bool swapped) {
        uint32_t value = 0;
        std::memcpy(&value, meta.constData() + offset, sizeof value);
        return swapped ? __builtin_bswap32(value) : value;
    };
    constexpr uint32_t HashMagic = 0x061561;
    const bool swapped = word(12, false) != HashMagic;
    if (word(12, swapped) != HashMagic)
        return; // not a hash file: the library says what it is
    const qint64 expected = (qint64(word(32, swapped)) + 1) * word(20, swapped);
    if (file.size() < expected) {
        throw std::runtime_error(
            QStringLiteral("the file is truncated: %1 of %2 bytes").arg(file.size()).arg(expected).toStdString());
    }
}

// The write's own error is the one worth reporting.
void abortQuietly(DbTxn *txn)
{
    try {
        txn->abort();
    } catch (const std::exception &) {
    }
}

QByteArray local(const QString &path)
{
    return QFile::encodeName(path);
}

QString fromLocal(const QByteArray &path)
{
    return QFile::decodeName(path);
}

} // namespace

VirtualUserDb::VirtualUserDb(const QByteArray &databasePath, const RootDirectory &root, Access access)
    : m_root(root)
    , m_access(access)
{
    const int slash = databasePath.lastIndexOf('/');
    const QByteArray directory = slash < 0 ? QByteArray("./") : databasePath.left(slash + 1);
    QByteArray fileName = slash < 0 ? databasePath : databasePath.mid(slash + 1);
    // pam_userdb appends ".db" to its db= argument whatever it ends in:
    // "db=/x/users.db" opens /x/users.db.db, and so does the program.
    if (!fileName.isEmpty())
        fileName += ".db";

    if (m_access == Access::ReadWrite && !QDir().mkpath(fromLocal(m_root.resolve(directory)))) {
        const QString text
            = QCoreApplication::translate("VirtualUserDb", "Unable to create path for virtual user database: %1")
                  .arg(fromLocal(directory));
        throw std::runtime_error(text.toLocal8Bit().toStdString());
    }
    m_filePath = directory + fileName;
    open();
}

VirtualUserDb::~VirtualUserDb()
{
    close();
}

void VirtualUserDb::openEnvironment()
{
    const AppStrings &strings = AppStrings::instance();
    m_envHome = local(QDir::tempPath());
    m_resolvedEnvHome = QDir::tempPath();
    const QString stateDirectory = m_root.resolve(strings.stateDirectory);
    if (QFileInfo(stateDirectory).isDir() || QDir().mkpath(stateDirectory)) {
        m_envHome = local(strings.stateDirectory);
        m_resolvedEnvHome = stateDirectory;
    }
    m_env = std::make_unique<DbEnv>(0);
    // The logs hold the passwords too: nobody but root reads them.
    m_env->open(local(m_resolvedEnvHome).constData(), EnvironmentFlags, PrivateMode);
}

void VirtualUserDb::open()
{
    if (m_open)
        return;
    QByteArray resolvedFile = m_root.resolve(m_filePath);
    // Within an environment the library reads a relative name against the
    // environment's home; the administrator means the current directory.
    if (!resolvedFile.startsWith('/'))
        resolvedFile = local(QDir::current().absoluteFilePath(fromLocal(resolvedFile)));
    try {
        if (m_access == Access::ReadOnly) {
            if (!QFileInfo::exists(fromLocal(resolvedFile)))
                return;
            checkNotTruncated(fromLocal(resolvedFile));
            m_db = std::make_unique<Db>(nullptr, 0);
            m_db->set_error_stream(&std::cerr);
            m_db->open(nullptr, resolvedFile.constData(), nullptr, DB_HASH, DB_RDONLY, 0);
        } else {
            openEnvironment();
            checkNotTruncated(fromLocal(resolvedFile));
            if (m_resetLsns && QFileInfo::exists(fromLocal(resolvedFile))) {
                // A file that outlived the logs of its old environment names
                // log positions the new one never had; without a reset the
                // library refuses to write it back.
                m_env->lsn_reset(resolvedFile.constData(), 0);
            }
            m_resetLsns = false;
            m_db = std::make_unique<Db>(m_env.get(), 0);
            m_db->set_error_stream(&std::cerr);
            m_db->open(nullptr, resolvedFile.constData(), nullptr, DB_HASH, OpenFlags, PrivateMode);
            ensurePrivateMode();
        }
        m_open = true;
    } catch (const std::exception &e) {
        std::cerr << "Error opening database: " << m_filePath.constData() << "\n" << e.what() << std::endl;
        close();
    }
}

void VirtualUserDb::close()
{
    const auto closeQuietly = [this](auto &handle) {
        if (!handle)
            return;
        try {
            handle->close(0);
        } catch (const std::exception &e) {
            std::cerr << "Error closing database: " << m_filePath.constData() << "\n" << e.what() << std::endl;
        }
        handle.reset();
    };
    closeQuietly(m_db);
    // Closing the environment too lets the next open run recovery alone
    // and frees its regions.
    closeQuietly(m_env);
    m_open = false;
}

bool VirtualUserDb::isOpen() const
{
    return m_open;
}

std::vector<std::pair<QByteArray, QByteArray>> VirtualUserDb::readAll()
{
    std::vector<std::pair<QByteArray, QByteArray>> records;
    if (!m_open) {
        if (m_access == Access::ReadOnly && !QFileInfo::exists(fromLocal(m_root.resolve(m_filePath))))
            return records;
        throw DbException("the virtual users database is not open", EINVAL);
    }
    Dbc *cursor = nullptr;
    try {
        m_db->cursor(nullptr, &cursor, 0);
        Dbt key;
        Dbt data;
        while (cursor->get(&key, &data, DB_NEXT) == 0) {
            records.emplace_back(
                QByteArray(static_cast<const char *>(key.get_data()), static_cast<int>(key.get_size())),
                QByteArray(static_cast<const char *>(data.get_data()), static_cast<int>(data.get_size())));
        }
        cursor->close();
    } catch (DbException &e) {
        m_db->err(e.get_errno(), "Error in show_all_records");
        if (cursor)
            cursor->close();
        throw;
    }
    return records;
}

void VirtualUserDb::inTransaction(const std::function<void(DbTxn *)> &write)
{
    if (!m_open || m_access == Access::ReadOnly)
        throw DbException("the virtual users database is not open for writing", EINVAL);
    DbTxn *txn = nullptr;
    m_env->txn_begin(nullptr, &txn, 0);
    try {
        write(txn);
        txn->commit(0);
    } catch (...) {
        abortQuietly(txn);
        throw;
    }
}

void VirtualUserDb::put(const QByteArray &name, const QByteArray &password)
{
    inTransaction([&](DbTxn *txn) {
        Dbt key = bytes(name);
        Dbt data = bytes(password);
        m_db->put(txn, &key, &data, 0);
    });
}

void VirtualUserDb::del(const QByteArray &name)
{
    inTransaction([&](DbTxn *txn) {
        Dbt key = bytes(name);
        m_db->del(txn, &key, 0); // an absent key is no error
    });
}

void VirtualUserDb::apply(const QList<QByteArray> &deletes, const QList<std::pair<QByteArray, QByteArray>> &puts)
{
    if (deletes.isEmpty() && puts.isEmpty())
        return;
    inTransaction([&](DbTxn *txn) {
        for (const QByteArray &name : deletes) {
            Dbt key = bytes(name);
            m_db->del(txn, &key, 0);
        }
        for (const auto &[name, password] : puts) {
            Dbt key = bytes(name);
            Dbt data = bytes(password);
            m_db->put(txn, &key, &data, 0);
        }
    });
}

void VirtualUserDb::recreate(const QByteArray &configuredPath)
{
    std::cerr << "Closing db..." << std::endl;
    close();

    std::cerr << "Removing db..." << std::endl;
    m_lastBackup.clear();
    const QString resolved = fromLocal(m_root.resolve(configuredPath));
    const QFileInfo info(resolved);
    if (info.exists() && !info.isDir()) {
        // The re-created file holds only the records edited since loading:
        // keep the old one so that the others can be recovered by hand.
        const QByteArray backup = configuredPath + ".bak-"
            + QDateTime::currentDateTime().toString(QStringLiteral("yyyyMMdd-hhmmss")).toLatin1();
        const QString resolvedBackup = fromLocal(m_root.resolve(backup));
        QFile::remove(resolvedBackup);
        if (QFile::copy(resolved, resolvedBackup) && ::chmod(local(resolvedBackup).constData(), PrivateMode) == 0) {
            m_lastBackup = backup;
            std::cerr << "Keeping a copy of the old database in " << backup.constData() << std::endl;
            QFile::remove(resolved);
        } else {
            std::cerr << "Unable to keep a copy of the old database in " << backup.constData()
                      << "; the old file is left in place" << std::endl;
        }
    }

    if (!m_resolvedEnvHome.isEmpty()) {
        const QDir dir(m_resolvedEnvHome);
        std::cerr << "Home db: " << m_envHome.constData() << std::endl;
        const QStringList entries = dir.entryList({QStringLiteral("log.*"), QStringLiteral("__db*.*")},
                                                  QDir::Files | QDir::Hidden | QDir::System, QDir::Unsorted);
        for (const QString &entry : entries) {
            std::cerr << "Removing" << local(entry).constData() << std::endl;
            QFile::remove(dir.filePath(entry));
        }
    }

    std::cerr << "Iniit db..." << std::endl;
    m_resetLsns = true;
    open();
}

void VirtualUserDb::ensurePrivateMode() const
{
    ::chmod(m_root.resolve(m_filePath).constData(), PrivateMode);
}

const QByteArray &VirtualUserDb::filePath() const
{
    return m_filePath;
}

const QByteArray &VirtualUserDb::envHome() const
{
    return m_envHome;
}

const QByteArray &VirtualUserDb::lastBackupPath() const
{
    return m_lastBackup;
}
