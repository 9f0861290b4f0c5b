#include "AccountStore.h"

#include "common/AppStrings.h"
#include "common/Parallel.h"

#include <QFile>

#include <algorithm>
#include <cstdio>
#include <grp.h>
#include <iostream>
#include <pwd.h>

namespace {

AccountRecord recordFrom(const passwd &entry)
{
    AccountRecord record;
    if (entry.pw_passwd)
        record.password = entry.pw_passwd;
    record.uid = entry.pw_uid;
    record.gid = entry.pw_gid;
    record.gecos = entry.pw_gecos;
    record.home = entry.pw_dir;
    record.shell = entry.pw_shell;
    return record;
}

// Reads a file in the passwd format; false when it cannot be opened.
bool readPasswdFile(const QString &resolvedPath, std::map<QByteArray, AccountRecord> &map)
{
    FILE *file = std::fopen(QFile::encodeName(resolvedPath).constData(), "r");
    if (!file)
        return false;
    while (const passwd *entry = fgetpwent(file))
        map.emplace(QByteArray(entry->pw_name), recordFrom(*entry));
    std::fclose(file);
    return true;
}

void reportUnopened(const QString &path)
{
    std::cerr << "Unable to open " << QFile::encodeName(path).constData() << std::endl;
}

} // namespace

AccountStore::AccountStore(const QByteArray &databasePath, const RootDirectory &root, Access access)
    : m_root(root)
    , m_access(access)
    , m_databasePath(databasePath)
{
    loadPasswd();
    loadShadow();
    loadGroups();
    buildIndexes();
    if (!databasePath.isEmpty())
        loadVirtualUsers(databasePath);
}

AccountStore::~AccountStore() = default;

void AccountStore::loadPasswd()
{
    if (!m_root.isSystemRoot()) {
        const QString path = AppStrings::instance().passwdPath;
        if (!readPasswdFile(m_root.resolve(path), m_passwd))
            reportUnopened(path);
        return;
    }
    setpwent();
    while (const passwd *entry = getpwent())
        m_passwd.emplace(QByteArray(entry->pw_name), recordFrom(*entry));
    endpwent();
}

void AccountStore::loadShadow()
{
    // Read with the passwd parser on purpose: only the name and the second
    // field mean anything here.
    const QString path = AppStrings::instance().shadowPath;
    if (!readPasswdFile(m_root.resolve(path), m_shadow))
        reportUnopened(path);
}

void AccountStore::loadGroups()
{
    const QString path = AppStrings::instance().groupPath;
    FILE *file = std::fopen(QFile::encodeName(m_root.resolve(path)).constData(), "r");
    if (!file) {
        reportUnopened(path);
        return;
    }
    while (const group *entry = fgetgrent(file)) {
        GroupRecord record;
        record.name = entry->gr_name;
        record.gid = entry->gr_gid;
        for (char **member = entry->gr_mem; member && *member; ++member)
            record.members.insert(QByteArray(*member));
        m_groups.emplace(record.gid, std::move(record));
    }
    std::fclose(file);
}

void AccountStore::buildIndexes()
{
    // Maps iterate in key order: the first entry kept for a key is the one
    // a scan in that order would have found.
    for (const auto &[gid, group] : m_groups) {
        for (const QByteArray &member : group.members)
            m_supplementaryGroups[member].append(group.name);
        if (!m_groupIds.contains(group.name))
            m_groupIds.insert(group.name, gid);
    }
    m_passwdIndex.reserve(static_cast<int>(m_passwd.size()));
    // Most names asked of the accounts are virtual users' and no account.
    m_passwdFilter.reset(static_cast<int>(m_passwd.size()));
    for (const auto &[name, record] : m_passwd) {
        if (!m_userNames.contains(record.uid))
            m_userNames.insert(record.uid, name);
        m_passwdIndex.insert(name, &record);
        m_passwdFilter.add(name);
    }
    m_shadowIndex.reserve(static_cast<int>(m_shadow.size()));
    for (const auto &[name, record] : m_shadow)
        m_shadowIndex.insert(name, &record);
}

bool AccountStore::getUserInfo(const QByteArray &name, AccountRecord &record) const
{
    const AccountRecord *found = findAccount(name);
    if (!found)
        return false;
    record = *found;
    return true;
}

const AccountRecord *AccountStore::findAccount(const QByteArray &name) const
{
    return m_passwdFilter.mayContain(name) ? m_passwdIndex.value(name) : nullptr;
}

QByteArray AccountStore::shadowPassword(const QByteArray &name) const
{
    const AccountRecord *found = m_shadowIndex.value(name);
    return found ? found->password : QByteArray();
}

uint32_t AccountStore::firstUserId() const
{
    if (!m_firstUserId) {
        m_firstUserId = 1000; // Debian's UID_MIN when login.defs does not say
        QFile defs(m_root.resolve(QStringLiteral("/etc/login.defs")));
        if (defs.open(QIODevice::ReadOnly)) {
            for (const QByteArray &line : defs.readAll().split('\n')) {
                const QList<QByteArray> words = line.simplified().split(' ');
                bool ok = false;
                const uint32_t value = words.size() >= 2 && words[0] == "UID_MIN" ? words[1].toUInt(&ok) : 0;
                if (ok)
                    m_firstUserId = value;
            }
        }
    }
    return *m_firstUserId;
}

bool AccountStore::isSystemUser(const QByteArray &name) const
{
    const AccountRecord *account = findAccount(name);
    return account && isSystemAccount(*account);
}

bool AccountStore::isSystemAccount(const AccountRecord &account) const
{
    if (account.uid < firstUserId())
        return true;
    const QByteArray shell = account.shell.mid(account.shell.lastIndexOf('/') + 1);
    return shell == "nologin" || shell == "false";
}

bool AccountStore::isBadPassword(const QByteArray &name) const
{
    for (const auto *index : {&m_passwdIndex, &m_shadowIndex}) {
        const AccountRecord *found = index->value(name);
        if (found && (found->password == "!" || found->password == "*"))
            return true;
    }
    return false;
}

const QByteArray *AccountStore::primaryGroupName(const QByteArray &name) const
{
    const AccountRecord *account = findAccount(name);
    if (!account)
        return nullptr;
    const auto primary = m_groups.find(account->gid);
    if (primary == m_groups.end()) {
        std::cerr << "Warning: user has gid=" << account->gid << ", but such group could not be found" << std::endl;
        return nullptr;
    }
    return &primary->second.name;
}

QList<QByteArray> AccountStore::userGroups(const QByteArray &name) const
{
    QList<QByteArray> result = m_supplementaryGroups.value(name);
    if (const QByteArray *primary = primaryGroupName(name))
        result.append(*primary);
    return result;
}

bool AccountStore::isUserInGroup(const QByteArray &name, const QByteArray &groupName) const
{
    // Asked for every user's root: answered without a list of the groups.
    const auto supplementary = m_supplementaryGroups.constFind(name);
    if (supplementary != m_supplementaryGroups.constEnd() && supplementary->contains(groupName))
        return true;
    const QByteArray *primary = primaryGroupName(name);
    return primary && *primary == groupName;
}

int AccountStore::groupIdByName(const QByteArray &groupName) const
{
    const auto it = m_groupIds.find(groupName);
    return it == m_groupIds.end() ? -1 : static_cast<int>(*it);
}

QByteArray AccountStore::userNameById(uint32_t uid) const
{
    return m_userNames.value(uid);
}

const std::map<QByteArray, AccountRecord> &AccountStore::accounts() const
{
    return m_passwd;
}

const std::map<QByteArray, AccountRecord> &AccountStore::shadow() const
{
    return m_shadow;
}

const std::map<uint32_t, GroupRecord> &AccountStore::groups() const
{
    return m_groups;
}

void AccountStore::loadVirtualUsers(const QByteArray &path)
{
    if (!path.isEmpty() && path != m_databasePath) {
        m_databasePath = path;
        m_db.reset(); // the PAM file names another database
    }
    if (!m_db)
        m_db = std::make_unique<VirtualUserDb>(m_databasePath, m_root, m_access);
    m_virtualUsers.clear();
    m_virtualNames.clear();
    m_virtualUsersChanged = false;
    const auto records = m_db->readAll();
    // The hash file gives its keys in no order: sorted first, each goes in
    // at the end of the map instead of by a walk down the tree. The halves
    // are sorted on two threads, the second also filling the set of names;
    // the records themselves never move while both read them.
    using Record = std::pair<QByteArray, QByteArray>;
    std::vector<const Record *> order(records.size());
    for (size_t i = 0; i < records.size(); ++i)
        order[i] = &records[i];
    const auto byName = [](const Record *a, const Record *b) { return a->first < b->first; };
    const auto middle = order.begin() + static_cast<std::ptrdiff_t>(order.size() / 2);
    onTwoThreads([&] { std::sort(order.begin(), middle, byName); },
                 [&] {
                     std::sort(middle, order.end(), byName);
                     m_virtualNames.reserve(static_cast<int>(records.size()));
                     for (const Record &record : records)
                         m_virtualNames.insert(record.first);
                 });
    std::inplace_merge(order.begin(), middle, order.end(), byName);
    for (const Record *record : order) {
        m_virtualUsers.emplace_hint(m_virtualUsers.end(), record->first,
                                    VirtualUserRecord{record->second, {}, VirtualUserState::Unchanged});
    }
}

bool AccountStore::isVirtualUser(const QByteArray &name) const
{
    return m_virtualNames.contains(name);
}

std::optional<QByteArray> AccountStore::livePassword(const QByteArray &name) const
{
    const auto found = m_virtualUsers.find(name);
    if (found == m_virtualUsers.end() || found->second.state == VirtualUserState::Deleted)
        return std::nullopt;
    return found->second.password;
}

void AccountStore::addVirtualUser(const QByteArray &name, const QByteArray &password)
{
    m_virtualUsersChanged = true;
    const auto it = m_virtualUsers.find(name);
    if (it == m_virtualUsers.end()) {
        m_virtualUsers.emplace(name, VirtualUserRecord{password, {}, VirtualUserState::Added});
        m_virtualNames.insert(name);
    } else if (it->second.state == VirtualUserState::Deleted) {
        it->second.password = password;
        it->second.state = VirtualUserState::Added;
    }
}

void AccountStore::changeVirtualUser(const QByteArray &oldName, const QByteArray &newName, const QByteArray &password)
{
    const auto it = m_virtualUsers.find(oldName);
    if (it == m_virtualUsers.end())
        return;
    m_virtualUsersChanged = true;
    VirtualUserRecord &record = it->second;
    if (!password.isEmpty() && password != record.password) {
        record.password = password;
        record.state = VirtualUserState::Modified;
    }
    if (newName == oldName)
        return;
    record.state = VirtualUserState::Modified;
    // The key to delete is the one on disk: a second rename before the
    // save must not leave the first name able to log in.
    if (record.previousName.isEmpty())
        record.previousName = oldName;
    const VirtualUserRecord moved = record;
    m_virtualUsers.erase(it);
    m_virtualNames.remove(oldName);
    m_virtualUsers[newName] = moved;
    m_virtualNames.insert(newName);
}

void AccountStore::removeVirtualUser(const QByteArray &name)
{
    const auto it = m_virtualUsers.find(name);
    if (it != m_virtualUsers.end()) {
        it->second.state = VirtualUserState::Deleted;
        m_virtualUsersChanged = true;
    }
}

void AccountStore::syncVirtualUsers()
{
    if (!m_db)
        m_db = std::make_unique<VirtualUserDb>(m_databasePath, m_root, m_access);
    // Every delete before any put, in one transaction: a name renamed away
    // and added again is written last, and a rename is never half done.
    QList<QByteArray> deletes;
    QList<std::pair<QByteArray, QByteArray>> puts;
    for (const auto &[name, record] : m_virtualUsers) {
        switch (record.state) {
        case VirtualUserState::Modified:
            if (!record.previousName.isEmpty()) // a password change keeps the key
                deletes.append(record.previousName);
            puts.append({name, record.password});
            break;
        case VirtualUserState::Added:
            puts.append({name, record.password});
            break;
        case VirtualUserState::Deleted:
            deletes.append(name);
            break;
        case VirtualUserState::Unchanged:
            break;
        }
    }
    m_db->apply(deletes, puts);
    // Closing flushes the pages to the file that pam_userdb reads.
    m_db->close();
    m_db->open();
    // What is in memory is now what is on disk. Left marked, the next save
    // would delete a renamed user's first name again instead of the name
    // it has on disk now, and a deleted name would still count as a user.
    for (auto it = m_virtualUsers.begin(); it != m_virtualUsers.end();) {
        if (it->second.state == VirtualUserState::Deleted) {
            m_virtualNames.remove(it->first);
            it = m_virtualUsers.erase(it);
            continue;
        }
        it->second.state = VirtualUserState::Unchanged;
        it->second.previousName.clear();
        ++it;
    }
    m_virtualUsersChanged = false;
}

void AccountStore::recreateVirtualUserDb()
{
    if (!m_db)
        m_db = std::make_unique<VirtualUserDb>(m_databasePath, m_root, m_access);
    m_db->recreate(m_databasePath);
}

void AccountStore::saveVirtualUsers()
{
    try {
        syncVirtualUsers();
    } catch (const std::exception &) {
        std::cerr << "Db env. error. Re-creating database" << std::endl;
        recreateVirtualUserDb();
        syncVirtualUsers();
    }
}

const std::map<QByteArray, VirtualUserRecord> &AccountStore::virtualUsers() const
{
    return m_virtualUsers;
}

bool AccountStore::virtualUsersChanged() const
{
    return m_virtualUsersChanged;
}

const QSet<QByteArray> &AccountStore::virtualUserKeys() const
{
    return m_virtualNames;
}

const QByteArray &AccountStore::databasePath() const
{
    return m_databasePath;
}

VirtualUserDb *AccountStore::database() const
{
    return m_db.get();
}

bool sameName(const QString &uiName, const QByteArray &name)
{
    return uiName.toUtf8() == name;
}

bool sameName(const QByteArray &name, const QString &uiName)
{
    return sameName(uiName, name);
}
