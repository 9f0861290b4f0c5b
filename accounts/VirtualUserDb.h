#pragma once

#include "common/RootDirectory.h"

#include <QByteArray>
#include <QList>

#include <cstdint>
#include <functional>
#include <memory>
#include <utility>
#include <vector>

class Db;
class DbEnv;
class DbTxn;

enum class VirtualUserState : uint32_t {
    Unchanged = 0,
    Modified = 1,
    Added = 2,
    Deleted = 3,
};

struct VirtualUserRecord
{
    QByteArray password; // clear text: pam_userdb compares it as stored
    QByteArray previousName; // the key to delete on save after a rename
    VirtualUserState state = VirtualUserState::Unchanged;
};

// The Berkeley DB hash file that pam_userdb reads: key the user name, data
// the clear-text password, both without a terminating NUL. Writes go through
// a transactional environment in the program's state directory; the file
// itself is kept mode 0600.
class VirtualUserDb
{
public:
    static constexpr uint32_t EnvironmentFlags = 0x2403; // CREATE | RECOVER | INIT_MPOOL | INIT_TXN
    static constexpr uint32_t OpenFlags = 0x301; // CREATE | AUTO_COMMIT | READ_UNCOMMITTED

    enum class Access { ReadWrite, ReadOnly };

    // Derives the file path from the configured one (".db" appended, as
    // pam_userdb does), creates its directory and opens. Throws std::runtime_error
    // when the directory cannot be created. ReadOnly creates nothing: no
    // directory, no environment, no file; a missing file reads as empty.
    VirtualUserDb(const QByteArray &databasePath, const RootDirectory &root, Access access = Access::ReadWrite);
    ~VirtualUserDb();

    VirtualUserDb(const VirtualUserDb &) = delete;
    VirtualUserDb &operator=(const VirtualUserDb &) = delete;

    // Open and close never throw: failures are reported on standard error
    // and leave the handle closed, so that later operations throw instead.
    void open();
    void close();
    bool isOpen() const;

    // Every record in file order. Throws DbException.
    std::vector<std::pair<QByteArray, QByteArray>> readAll();
    // Each in a transaction of its own. Throw DbException.
    void put(const QByteArray &name, const QByteArray &password);
    void del(const QByteArray &name);
    // The deletes, then the puts, all in one transaction. Throws DbException.
    void apply(const QList<QByteArray> &deletes, const QList<std::pair<QByteArray, QByteArray>> &puts);

    // Drops the file the configured path names as written (after copying
    // it beside itself), never the one opened, which has ".db" appended;
    // then the environment's logs and regions, and opens afresh.
    void recreate(const QByteArray &configuredPath);

    // Paths as the administrator knows them.
    const QByteArray &filePath() const;
    const QByteArray &envHome() const;
    // Where recreate() last kept the old file; empty when it kept none.
    const QByteArray &lastBackupPath() const;

private:
    void openEnvironment();
    // Runs one write in a transaction of its own; aborted when it throws.
    void inTransaction(const std::function<void(DbTxn *)> &write);
    void ensurePrivateMode() const;

    RootDirectory m_root;
    Access m_access;
    std::unique_ptr<DbEnv> m_env;
    std::unique_ptr<Db> m_db;
    bool m_open = false;
    bool m_resetLsns = false;
    QByteArray m_filePath;
    QByteArray m_envHome;
    QString m_resolvedEnvHome;
    QByteArray m_lastBackup;
};
