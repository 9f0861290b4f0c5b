#pragma once

#include "VirtualUserDb.h"
#include "common/NameFilter.h"
#include "common/RootDirectory.h"

#include <QByteArray>
#include <QHash>
#include <QList>
#include <QSet>
#include <QString>

#include <cstdint>
#include <map>
#include <memory>
#include <optional>
#include <set>

struct AccountRecord
{
    QByteArray password;
    uint32_t uid = 0;
    uint32_t gid = 0;
    QByteArray gecos;
    QByteArray home;
    QByteArray shell;
};

struct GroupRecord
{
    QByteArray name;
    uint32_t gid = 0;
    std::set<QByteArray> members;
};

// The host's accounts and the virtual FTP users, read once at start-up. On
// the system root the accounts come from the name service enumeration (so
// LDAP or NIS accounts count too); on any other root from its etc/passwd.
class AccountStore
{
public:
    using Access = VirtualUserDb::Access;

    explicit AccountStore(const QByteArray &databasePath, const RootDirectory &root = RootDirectory(),
                          Access access = Access::ReadWrite);
    ~AccountStore();

    bool getUserInfo(const QByteArray &name, AccountRecord &record) const;
    // The same without a copy; null when there is no such account.
    const AccountRecord *findAccount(const QByteArray &name) const;
    QByteArray shadowPassword(const QByteArray &name) const;
    // Exactly "!" or "*" in passwd or shadow: a locked hash ("!$6$...") or
    // "!!" is not bad.
    bool isBadPassword(const QByteArray &name) const;
    // As Debian decides it: an id below UID_MIN of login.defs, or a shell
    // that cannot log in. Names that are no account are not system users.
    bool isSystemUser(const QByteArray &name) const;
    // The same of an account at hand.
    bool isSystemAccount(const AccountRecord &account) const;
    // Supplementary groups in gid order, then the primary group.
    QList<QByteArray> userGroups(const QByteArray &name) const;
    bool isUserInGroup(const QByteArray &name, const QByteArray &groupName) const;
    // The lowest gid of that name; -1 when no group has it.
    int groupIdByName(const QByteArray &groupName) const;
    // The first account in name order with that uid; empty when none has it.
    QByteArray userNameById(uint32_t uid) const;

    const std::map<QByteArray, AccountRecord> &accounts() const;
    const std::map<QByteArray, AccountRecord> &shadow() const;
    const std::map<uint32_t, GroupRecord> &groups() const;

    // Virtual users: edits stay in memory until syncVirtualUsers().
    void loadVirtualUsers(const QByteArray &path);
    bool isVirtualUser(const QByteArray &name) const;
    // A virtual user that is still there: a deleted one waits for the save
    // and may be added again. Its password, or nothing.
    std::optional<QByteArray> livePassword(const QByteArray &name) const;
    void addVirtualUser(const QByteArray &name, const QByteArray &password);
    void changeVirtualUser(const QByteArray &oldName, const QByteArray &newName, const QByteArray &password);
    void removeVirtualUser(const QByteArray &name);
    void syncVirtualUsers();
    void recreateVirtualUserDb();
    // What a save does: sync, and when that throws, re-create the database
    // and sync once more. The re-created file holds only the records added
    // or changed since loading (the old file is kept beside it). Throws what
    // the second attempt throws.
    void saveVirtualUsers();

    const std::map<QByteArray, VirtualUserRecord> &virtualUsers() const;
    // Some virtual user added, changed or deleted since the database was read.
    bool virtualUsersChanged() const;
    // The keys of virtualUsers(), deleted ones included.
    const QSet<QByteArray> &virtualUserKeys() const;
    const QByteArray &databasePath() const;
    VirtualUserDb *database() const;

private:
    // The name of the user's primary group; none for no account, or a gid
    // no group has (said on standard error).
    const QByteArray *primaryGroupName(const QByteArray &name) const;
    void loadPasswd();
    void loadShadow();
    void loadGroups();
    void buildIndexes();

    uint32_t firstUserId() const;

    RootDirectory m_root;
    Access m_access;
    mutable std::optional<uint32_t> m_firstUserId;
    std::map<QByteArray, AccountRecord> m_passwd;
    std::map<QByteArray, AccountRecord> m_shadow;
    std::map<uint32_t, GroupRecord> m_groups;
    // Built once after loading: every user of the table is looked up in
    // them, and scanning all groups or accounts per user grows with the
    // square of the machine's size.
    QHash<QByteArray, QList<QByteArray>> m_supplementaryGroups; // in gid order
    QHash<QByteArray, uint32_t> m_groupIds;
    QHash<uint32_t, QByteArray> m_userNames;
    // Every row of the table looks its name up here several times; a hash
    // beside the ordered maps keeps that off the tree walks. The maps never
    // change after loading, so the pointers stay valid.
    QHash<QByteArray, const AccountRecord *> m_passwdIndex;
    NameFilter m_passwdFilter; // in front of the index
    QHash<QByteArray, const AccountRecord *> m_shadowIndex;
    std::map<QByteArray, VirtualUserRecord> m_virtualUsers;
    QSet<QByteArray> m_virtualNames; // the keys of m_virtualUsers
    bool m_virtualUsersChanged = false;
    QByteArray m_databasePath;
    std::unique_ptr<VirtualUserDb> m_db;
};

// Names typed in the user interface against names from the system.
bool sameName(const QString &uiName, const QByteArray &name);
bool sameName(const QByteArray &name, const QString &uiName);
