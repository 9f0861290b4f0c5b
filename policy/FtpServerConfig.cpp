// Construction, settings lookups, the user kinds and the accessors of FtpServerConfig.
#include "FtpServerConfig.h"
#include "FtpServerConfigInternal.h"

#include "common/AppStrings.h"

#include <QFile>

#include <atomic>

namespace {

// What this thread has looked up by path in a pass: the forecast's thread
// and the verdicts' would otherwise queue on the pass's lock for every
// user's home. Tied to the pass by its number, never by its address, which
// a later pass may reuse.
struct ThreadPaths
{
    quint64 pass = 0;
    QHash<QByteArray, std::optional<struct stat>> paths;
};
thread_local ThreadPaths threadPaths;

quint64 nextPassNumber()
{
    static std::atomic<quint64> last{0};
    return ++last;
}

} // namespace

FtpServerConfig::PassCache::PassCache()
    : number(nextPassNumber())
{
}

FtpServerConfig::FtpServerConfig(Interaction &interaction, const RootDirectory &root, Mode mode)
    : m_interaction(interaction)
    , m_root(root)
    , m_mode(mode)
{
}

FtpServerConfig::~FtpServerConfig() = default;

FtpServerConfig::MetadataPass::MetadataPass(FtpServerConfig &config)
    : m_config(config)
    , m_outer(!config.m_pass)
{
    if (m_outer)
        m_config.m_pass = std::make_unique<PassCache>();
}

FtpServerConfig::MetadataPass::~MetadataPass()
{
    if (!m_outer)
        return;
    if (threadPaths.pass == m_config.m_pass->number)
        threadPaths = ThreadPaths();
    m_config.m_pass.reset();
}

void FtpServerConfig::MetadataPass::knownVirtualUser(const QByteArray &user)
{
    m_config.m_pass->virtualQuery = user;
    m_config.m_pass->virtualAnswer = true;
}

std::optional<struct stat> FtpServerConfig::fileStatus(const QString &resolvedPath) const
{
    const auto read = [&]() -> std::optional<struct stat>
    {
        struct stat info
        {
        };
        if (::stat(QFile::encodeName(resolvedPath).constData(), &info) != 0)
            return std::nullopt;
        return info;
    };
    if (!m_pass)
        return read();
    const std::lock_guard<std::mutex> lock(m_pass->statusLock);
    auto it = m_pass->metadata.constFind(resolvedPath);
    if (it == m_pass->metadata.constEnd())
        it = m_pass->metadata.insert(resolvedPath, read());
    return *it;
}

QString FtpServerConfig::resolved(const QByteArray &path) const
{
    return m_root.resolve(QFile::decodeName(path));
}

// Loading ---------------------------------------------------------------
QByteArray FtpServerConfig::configuredUserlistPath() const
{
    // Deliberately the program's own file, not the server's default.
    return value("userlist_file", DefaultListDirectory + "allowed_user_list.conf");
}

QByteArray FtpServerConfig::configuredChrootListPath() const
{
    return value("chroot_list_file", "/etc/vsftpd.chroot_list");
}

std::optional<struct stat> FtpServerConfig::pathStatus(const QByteArray &path) const
{
    if (!m_pass)
        return fileStatus(resolved(path));
    if (threadPaths.pass != m_pass->number)
        threadPaths = ThreadPaths{m_pass->number, {}};
    auto it = threadPaths.paths.constFind(path);
    if (it == threadPaths.paths.constEnd())
        it = threadPaths.paths.insert(path, fileStatus(resolved(path)));
    return *it;
}

std::optional<QByteArray> FtpServerConfig::mainValue(const QByteArray &key) const
{
    const auto read = [&]() -> std::optional<QByteArray> {
        const auto data = findData(m_main.elements, "", str(key));
        return data ? std::optional<QByteArray>(QByteArray::fromStdString(data->value)) : std::nullopt;
    };
    if (!m_pass)
        return read();
    auto it = m_pass->values.constFind(key);
    if (it == m_pass->values.constEnd())
        it = m_pass->values.insert(key, read());
    return *it;
}

std::optional<QByteArray> FtpServerConfig::literalValue(const char *key, int size) const
{
    if (m_pass) {
        for (const auto &[literal, value] : m_pass->literals) {
            if (literal == key)
                return value;
        }
    }
    const std::optional<QByteArray> value = mainValue(QByteArray::fromRawData(key, size));
    if (m_pass)
        m_pass->literals.emplace_back(key, value);
    return value;
}

QByteArray FtpServerConfig::value(const QByteArray &key, const QByteArray &defaultValue) const
{
    return mainValue(key).value_or(defaultValue);
}

bool FtpServerConfig::isYes(const QByteArray &key, bool absentMeansYes) const
{
    // Compared in place: this runs several times for every user.
    const std::optional<QByteArray> found = mainValue(key);
    return found ? found->compare("yes", Qt::CaseInsensitive) == 0 : absentMeansYes;
}

void FtpServerConfig::setYes(const QByteArray &key)
{
    setValue(m_main.elements, "", str(key), "yes");
    m_modified = true;
}

// Users ------------------------------------------------------------------

bool FtpServerConfig::isAnonymousUser(const QByteArray &user) const
{
    // The names never change while the program runs: converted once, not
    // for every user of every check.
    static const QByteArray row = AppStrings::instance().anonymousUsers.toLocal8Bit();
    static const QByteArray word = AppStrings::instance().anonymousWord.toLocal8Bit();
    return user == row || user == word || user == "ftp";
}

bool FtpServerConfig::isVirtualUser(const QByteArray &user) const
{
    if (!m_accounts)
        return false;
    if (!m_pass)
        return m_accounts->isVirtualUser(user);
    if (m_pass->virtualQuery.isNull() || m_pass->virtualQuery != user) {
        m_pass->virtualQuery = user;
        m_pass->virtualAnswer = m_accounts->isVirtualUser(user);
    }
    return m_pass->virtualAnswer;
}

FtpServerConfig::UserlistMode FtpServerConfig::userlistMode() const
{
    const std::optional<QByteArray> enabled = mainValue("userlist_enable");
    if (enabled && enabled->compare("no", Qt::CaseInsensitive) == 0)
        return UserlistMode::Off;
    return isYes("userlist_deny", true) ? UserlistMode::Deny : UserlistMode::Allow;
}

bool FtpServerConfig::isChrooted(const QByteArray &user) const
{
    if (isYes("guest_enable"))
        return true;
    if (!m_accounts || !m_accounts->findAccount(user))
        return true;
    const bool local = isYes("chroot_local_user");
    if (!isYes("chroot_list_enable"))
        return local;
    const bool listed = m_chrootList.contains(user);
    return local ? !listed : listed;
}

QByteArray FtpServerConfig::effectiveRoot(const QByteArray &user) const
{
    // Asked twice in a row for the same user (the check, then the row that
    // shows it): within a pass the second answer is the first.
    if (m_pass && m_pass->rootUser == user && !user.isEmpty())
        return m_pass->root;
    QByteArray root = isChrooted(user) ? configuredRoot(user) : QByteArrayLiteral("/");
    if (m_pass) {
        m_pass->rootUser = user;
        m_pass->root = root;
    }
    return root;
}

QByteArray FtpServerConfig::configuredRoot(const QByteArray &user) const
{
    const auto homeOf = [this](const QByteArray &account) {
        const AccountRecord *record = m_accounts ? m_accounts->findAccount(account) : nullptr;
        return record ? record->home : QByteArray();
    };
    const ConfigFile *own = userConfig(user);
    const auto ownValue = [own](const char *key) -> std::optional<QByteArray> {
        if (own) {
            if (const auto data = findData(own->elements, "", key))
                return QByteArray::fromStdString(data->value);
        }
        return std::nullopt;
    };
    if (isAnonymousUser(user)) {
        if (const auto localRoot = ownValue("local_root"))
            return *localRoot;
        if (const auto anonRoot = mainValue("anon_root"))
            return *anonRoot;
        return homeOf(value("guest_username", "ftp"));
    }
    // The server puts the login name for user_sub_token into the home (the
    // guest account's too) and into local_root, and enters a relative
    // local_root from the home.
    const QByteArray token = ownValue("user_sub_token").value_or(mainValue("user_sub_token").value_or(QByteArray()));
    const bool guest = isVirtualUser(user) && isYes("guest_enable");
    // Every guest without a file of its own or a token has the same root:
    // worked out once a pass, not for each of 100,000 virtual users.
    const bool shared = guest && !own && token.isEmpty() && m_pass;
    if (shared && m_pass->sharedGuestRoot)
        return *m_pass->sharedGuestRoot;
    const auto expand = [&](QByteArray path) { return token.isEmpty() ? path : path.replace(token, user); };
    const QByteArray home = expand(guest ? homeOf(value("guest_username", "ftp")) : homeOf(user));
    std::optional<QByteArray> localRoot = ownValue("local_root");
    if (!localRoot)
        localRoot = mainValue("local_root");
    QByteArray root = home;
    if (localRoot) {
        const QByteArray directory = expand(*localRoot);
        root = directory.startsWith('/') || home.isEmpty() ? directory
                                                           : home + (home.endsWith('/') ? "" : "/") + directory;
    }
    if (shared)
        m_pass->sharedGuestRoot = root;
    return root;
}

QList<QByteArray> FtpServerConfig::virtualUserNames() const
{
    QList<QByteArray> names;
    if (!m_accounts)
        return names;
    for (const auto &[name, record] : m_accounts->virtualUsers()) {
        if (record.state != VirtualUserState::Deleted)
            names.append(name);
    }
    return names;
}

void FtpServerConfig::setOption(const QByteArray &key, const QByteArray &value)
{
    setValue(m_main.elements, "", key.toStdString(), value.toStdString());
    m_modified = true;
}

void FtpServerConfig::removeOption(const QByteArray &key)
{
    const std::string name = key.toStdString();
    const auto before = m_main.elements.size();
    m_main.elements.remove_if([&](const ConfigElementPtr &element) {
        const auto data = std::dynamic_pointer_cast<ConfigElementData>(element);
        return data && data->key == name;
    });
    if (m_main.elements.size() != before)
        m_modified = true;
}

void FtpServerConfig::optionsChanged()
{
    // The options may name another chroot list: the table judges users by
    // the list the server will read.
    if (configuredChrootListPath() != m_chrootListPath)
        loadChrootList();
}

void FtpServerConfig::setChrootList(const QByteArray &path, const QStringList &names)
{
    const NameList list(names);
    if (path == m_chrootListPath && list.names() == m_chrootList.names())
        return;
    if (path != m_chrootListPath) {
        // What the file holds now, so that a save writes it only when the
        // names differ.
        m_loadedText[text(path)] = nameListContent(NameList(readNameList(path)), path).toStdString();
    }
    m_chrootListPath = path;
    m_chrootList = list;
    m_chrootListModified = m_modified = true;
}

QByteArray FtpServerConfig::ftpAccountName(const QByteArray &user) const
{
    if (isAnonymousUser(user))
        return value("ftp_username", "ftp");
    if (isVirtualUser(user))
        return value("guest_username", "ftp");
    return user;
}

// Access evaluation --------------------------------------------------------

ConfigFile &FtpServerConfig::mainConfig()
{
    return m_main;
}

bool FtpServerConfig::mainConfigExisted() const
{
    return m_mainConfigExisted;
}

ConfigFile &FtpServerConfig::pamConfig()
{
    return m_pam;
}

bool FtpServerConfig::pamConfigExisted() const
{
    return m_pamConfigExisted;
}

const QByteArray &FtpServerConfig::pamServiceName() const
{
    return m_pamServiceName;
}

const std::optional<FtpServerConfig::FtpusersRule> &FtpServerConfig::ftpusersRule() const
{
    return m_ftpusersRule;
}

ConfigFile &FtpServerConfig::ftpusersList()
{
    m_ftpusersIndexValid = false; // the caller may change it
    return m_ftpusers;
}

bool FtpServerConfig::ftpusersModified() const
{
    return m_ftpusersModified;
}

NameList &FtpServerConfig::userlist()
{
    return m_userlist;
}

const QByteArray &FtpServerConfig::userlistPath() const
{
    return m_userlistPath;
}

bool FtpServerConfig::userlistModified() const
{
    return m_userlistModified;
}

NameList &FtpServerConfig::chrootList()
{
    return m_chrootList;
}

const QByteArray &FtpServerConfig::chrootListPath() const
{
    return m_chrootListPath;
}

bool FtpServerConfig::chrootListModified() const
{
    return m_chrootListModified;
}

const QByteArray &FtpServerConfig::userConfigDir() const
{
    return m_userConfigDir;
}

std::map<QByteArray, std::shared_ptr<ConfigFile>> &FtpServerConfig::userConfigs()
{
    return m_userConfigs;
}

ConfigFile *FtpServerConfig::userConfig(const QByteArray &user) const
{
    const auto it = m_userConfigs.find(user);
    return it == m_userConfigs.end() ? nullptr : it->second.get();
}

const QByteArray &FtpServerConfig::virtualUsersDbPath() const
{
    return m_dbPath;
}

AccountStore &FtpServerConfig::accounts()
{
    return *m_accounts;
}

const AccountStore &FtpServerConfig::accounts() const
{
    return *m_accounts;
}

const RootDirectory &FtpServerConfig::root() const
{
    return m_root;
}

Interaction &FtpServerConfig::interaction()
{
    return m_interaction;
}

FtpServerConfig::Mode FtpServerConfig::mode() const
{
    return m_mode;
}

bool FtpServerConfig::isModified() const
{
    return m_modified;
}

void FtpServerConfig::setModified(bool modified)
{
    m_modified = modified;
}
