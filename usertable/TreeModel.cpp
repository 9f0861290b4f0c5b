#include "TreeModel.h"

#include "accounts/AccountStore.h"
#include "common/AppStrings.h"
#include "common/RootDirectory.h"
#include "common/SafeFile.h"
#include "forecast/LoginForecast.h"
#include "policy/FtpServerConfig.h"
#include "policy/Interaction.h"

#include <QApplication>
#include <QBrush>
#include <QColor>
#include <QElapsedTimer>
#include <QPalette>
#include <QScopedValueRollback>

struct TreeModel::Item
{
    enum class Kind { Group, User, Anonymous };

    Kind kind = Kind::Group;
    QByteArray name; // as the engine knows it
    QString label;
    Item *parent = nullptr;
    int row = 0;
    std::vector<std::unique_ptr<Item>> children;

    // Filled from the engine when first shown, and again after a change.
    // The verdict is made for every row (the filters need it); the root and
    // rights only for the rows painted.
    bool computed = false;
    bool allowed = false;
    AccessFailure failure;
    bool detailed = false;
    QString directory;
    QString mode;
    std::optional<UserForecast> forecast;
    // Whether a system account has the name, for the filter.
    std::optional<bool> system;

    Item *append(std::unique_ptr<Item> child)
    {
        child->parent = this;
        child->row = static_cast<int>(children.size());
        children.push_back(std::move(child));
        return children.back().get();
    }
};

namespace {

std::unique_ptr<TreeModel::Item> makeItem(TreeModel::Item::Kind kind, const QByteArray &name, const QString &label)
{
    auto item = std::make_unique<TreeModel::Item>();
    item->kind = kind;
    item->name = name;
    item->label = label;
    return item;
}

} // namespace

TreeModel::TreeModel(const QStringList &titles, Interaction &interaction, QObject *parent)
    : QAbstractItemModel(parent)
    , m_interaction(interaction)
    , m_config(std::make_unique<FtpServerConfig>(interaction, RootDirectory::fromEnvironment()))
    , m_groupIcon(QStringLiteral(":/prefix/icons/arrow_right.png"))
    , m_allowedIcon(QStringLiteral(":/prefix/icons/user_green.png"))
    , m_deniedIcon(QStringLiteral(":/prefix/icons/user_red.png"))
{
    m_titles = titles;
    m_evaluator.setInterval(0);
    connect(&m_evaluator, &QTimer::timeout, this, &TreeModel::evaluateSome);
    m_config->load();
    buildRows();
}

TreeModel::~TreeModel() = default;

void TreeModel::buildRows()
{
    const AppStrings &strings = AppStrings::instance();
    m_root = makeItem(Item::Kind::Group, {}, QString());
    Item *everybody = m_root->append(makeItem(Item::Kind::Group, {}, strings.everybody));
    m_localUsers = everybody->append(makeItem(Item::Kind::Group, {}, strings.localUsers));
    m_virtualUsers = everybody->append(makeItem(Item::Kind::Group, {}, strings.virtualUsers));
    everybody->append(makeItem(Item::Kind::Anonymous, strings.anonymousUsers.toLocal8Bit(), strings.anonymousUsers));
    // Which rows name a system account, for the filter that hides them:
    // read off each account here, and for a virtual user from the few
    // system names instead of a search of every account.
    const AccountStore &accounts = m_config->accounts();
    QSet<QByteArray> systemNames;
    for (const auto &[name, account] : accounts.accounts()) {
        Item *item = m_localUsers->append(makeItem(Item::Kind::User, name, QString::fromUtf8(name)));
        item->system = accounts.isSystemAccount(account);
        if (*item->system)
            systemNames.insert(name);
    }
    const QList<QByteArray> virtualNames = m_config->virtualUserNames();
    for (const QByteArray &name : virtualNames) {
        Item *item = m_virtualUsers->append(makeItem(Item::Kind::User, name, QString::fromUtf8(name)));
        item->system = systemNames.contains(name);
    }
    m_forecast.reset();
    // The PAM check may ask the operator: ask now, with nothing painted yet,
    // rather than from inside a paint when the first virtual row is shown.
    if (!virtualNames.isEmpty())
        compute(*m_virtualUsers->children.front());
    evaluateLater();
}

void TreeModel::evaluateLater()
{
    m_pendingGroup = 0;
    m_pendingRow = 0;
    m_evaluator.start();
}

void TreeModel::evaluateSome()
{
    // A few milliseconds at a time, so that the window stays responsive
    // while every verdict is made ready for the filters that need them all.
    // Never in the middle of an edit, whose questions run event loops of
    // their own while the engine is half-way through a repair.
    if (m_editing || QApplication::activeModalWidget())
        return;
    evaluatePending(8);
}

void TreeModel::evaluateAll()
{
    if (m_evaluator.isActive())
        evaluatePending(-1);
}

void TreeModel::evaluatePending(qint64 milliseconds)
{
    // Files and settings read once for all the users of the slice.
    FtpServerConfig::MetadataPass pass(*m_config);
    QElapsedTimer slice;
    slice.start();
    const Item *groups[] = {m_localUsers, m_virtualUsers};
    while (m_pendingGroup < 2) {
        const auto &children = groups[m_pendingGroup]->children;
        if (m_pendingRow >= children.size()) {
            ++m_pendingGroup;
            m_pendingRow = 0;
            continue;
        }
        Item &item = *children[m_pendingRow++];
        if (m_pendingGroup == 1 && !item.computed)
            pass.knownVirtualUser(item.name);
        compute(item);
        if (milliseconds >= 0 && (m_pendingRow & 63) == 0 && slice.elapsed() >= milliseconds)
            return;
    }
    m_evaluator.stop();
}

TreeModel::Item *TreeModel::itemOf(const QModelIndex &index) const
{
    return index.isValid() ? static_cast<Item *>(index.internalPointer()) : m_root.get();
}

void TreeModel::compute(Item &item) const
{
    if (item.computed || item.kind == Item::Kind::Group)
        return;
    item.computed = true;
    item.failure = AccessFailure();
    item.allowed = m_config->checkAccess(item.name, false, &item.failure);
    item.detailed = false;
    item.forecast.reset();
}

void TreeModel::computeDetails(Item &item) const
{
    compute(item);
    if (item.detailed)
        return;
    item.detailed = true;
    item.directory = QString::fromUtf8(m_config->configuredRoot(item.name));
    item.mode = rightsText(m_config->userRights(item.name));
}

const UserForecast &TreeModel::forecastOf(Item &item) const
{
    if (!item.forecast) {
        item.forecast = const_cast<TreeModel *>(this)->loginForecastMutable().forecast(item.name);
    }
    return *item.forecast;
}

LoginForecast &TreeModel::loginForecastMutable()
{
    if (!m_forecast)
        m_forecast = std::make_unique<LoginForecast>(*m_config);
    return *m_forecast;
}

const LoginForecast &TreeModel::loginForecast() const
{
    return const_cast<TreeModel *>(this)->loginForecastMutable();
}

QModelIndex TreeModel::index(int row, int column, const QModelIndex &parent) const
{
    if (!hasIndex(row, column, parent))
        return {};
    Item *parentItem = itemOf(parent);
    return createIndex(row, column, parentItem->children[static_cast<size_t>(row)].get());
}

QModelIndex TreeModel::parent(const QModelIndex &index) const
{
    if (!index.isValid())
        return {};
    Item *parentItem = itemOf(index)->parent;
    if (!parentItem || parentItem == m_root.get())
        return {};
    return createIndex(parentItem->row, 0, parentItem);
}

int TreeModel::rowCount(const QModelIndex &parent) const
{
    if (parent.column() > 0)
        return 0;
    return static_cast<int>(itemOf(parent)->children.size());
}

int TreeModel::columnCount(const QModelIndex &) const
{
    return static_cast<int>(m_titles.size());
}

QVariant TreeModel::data(const QModelIndex &index, int role) const
{
    if (!index.isValid())
        return {};
    Item &item = *itemOf(index);
    const AppStrings &strings = AppStrings::instance();
    const bool user = item.kind != Item::Kind::Group;
    if (user && role != Qt::SizeHintRole)
        compute(item);
    const int column = index.column();

    if (role == FilterRole) {
        // Asked of every row at each toggle of a filter: no text is made.
        if (!user)
            return {};
        if (!item.system)
            item.system = m_config->accounts().isSystemUser(item.name);
        return (*item.system ? SystemUser : 0) | (item.allowed ? AllowedUser : 0);
    }
    if (role == Qt::DisplayRole || role == Qt::EditRole) {
        switch (column) {
        case UsersColumn:
            return item.label;
        case StatusColumn:
            return user ? (item.allowed ? strings.allowed : strings.denied) : QString();
        case DirectoryColumn:
            if (!user)
                return QString();
            computeDetails(item);
            return item.directory;
        case ModeColumn:
            if (!user)
                return QString();
            computeDetails(item);
            return item.mode;
        case ServerColumn:
            return user ? forecastStatusText(forecastOf(item).status) : QString();
        default:
            return {};
        }
    }
    if (role == Qt::DecorationRole && column == UsersColumn) {
        if (!user)
            return m_groupIcon;
        return item.allowed ? m_allowedIcon : m_deniedIcon;
    }
    if (!user)
        return {};
    if (role == Qt::ToolTipRole) {
        if (column == StatusColumn) {
            if (item.allowed)
                return strings.allowed;
            return tr("%1: %2\n%3").arg(strings.denied, failureKindText(item.failure.kind), item.failure.message);
        }
        if (column == ServerColumn) {
            const UserForecast &forecast = forecastOf(item);
            if (forecast.findings.isEmpty())
                return forecastStatusText(forecast.status);
            return findingText(forecast.findings.first());
        }
        return {};
    }
    if (role == Qt::ForegroundRole && column == ServerColumn) {
        // The server disagreeing with the verdict is what the column is for.
        const ForecastStatus status = forecastOf(item).status;
        if ((status == ForecastStatus::Denied && item.allowed) || (status == ForecastStatus::Allowed && !item.allowed))
            return QBrush(QColor(0xc0, 0x39, 0x2b));
        return {};
    }
    if (role == FailureKindRole)
        return static_cast<uint>(item.failure.kind);
    if (role == ForecastRole && column == ServerColumn)
        return static_cast<int>(forecastOf(item).status);
    return {};
}

bool TreeModel::setData(const QModelIndex &index, const QVariant &value, int role)
{
    if (!index.isValid() || role != Qt::EditRole)
        return false;
    Item &item = *itemOf(index);
    if (item.kind == Item::Kind::Group)
        return false;
    compute(item);
    const QScopedValueRollback<bool> editing(m_editing, true);
    bool changed = false;
    switch (index.column()) {
    case UsersColumn:
        return rename(item, value.toString());
    case StatusColumn: {
        const QString status = value.toString();
        const AppStrings &strings = AppStrings::instance();
        if (status != strings.allowed && status != strings.denied) {
            invalidData(QString());
            return false;
        }
        changed = setStatus(item, status == strings.allowed);
        break;
    }
    case DirectoryColumn:
        changed = setDirectory(item, value.toString());
        break;
    case ModeColumn:
        changed = setMode(item, value.toString());
        break;
    default:
        return false;
    }
    if (changed)
        markChanged();
    return changed;
}

QVariant TreeModel::headerData(int section, Qt::Orientation orientation, int role) const
{
    if (orientation == Qt::Horizontal && role == Qt::DisplayRole && section >= 0 && section < m_titles.size())
        return m_titles[section];
    return {};
}

bool TreeModel::setHeaderData(int section, Qt::Orientation orientation, const QVariant &value, int role)
{
    if (orientation != Qt::Horizontal || role != Qt::EditRole || section < 0 || section >= m_titles.size())
        return false;
    m_titles[section] = value.toString();
    emit headerDataChanged(orientation, section, section);
    return true;
}

Qt::ItemFlags TreeModel::flags(const QModelIndex &index) const
{
    if (!index.isValid())
        return Qt::NoItemFlags;
    const Qt::ItemFlags base = Qt::ItemIsEnabled | Qt::ItemIsSelectable;
    const Item &item = *itemOf(index);
    if (item.kind == Item::Kind::Group || index.column() == ServerColumn)
        return base;
    // Names of others than virtual users are editable too, so that the
    // operator learns why they cannot change.
    if (index.column() == UsersColumn && item.kind == Item::Kind::Anonymous)
        return base;
    return base | Qt::ItemIsEditable;
}

FtpServerConfig &TreeModel::config()
{
    return *m_config;
}

bool TreeModel::hasUnsavedChanges() const
{
    return m_unsaved;
}

void TreeModel::setUnsavedChanges(bool unsaved)
{
    m_unsaved = unsaved;
}

void TreeModel::rebuild()
{
    beginResetModel();
    buildRows();
    endResetModel();
    emit engineChanged();
}

void TreeModel::removeVirtualUser(const QModelIndex &index)
{
    if (!isInVirtualGroup(index))
        return;
    m_config->accounts().removeVirtualUser(itemOf(index)->name);
    m_unsaved = true;
    rebuild();
    const QModelIndex top = this->index(0, 0);
    emit dataChanged(top, top);
}

void TreeModel::addVirtualUser(const QByteArray &name, const QByteArray &password)
{
    m_config->accounts().addVirtualUser(name, password);
    m_unsaved = true;
    rebuild();
}

void TreeModel::changeVirtualUser(const QByteArray &oldName, const QByteArray &newName, const QByteArray &password)
{
    m_config->accounts().changeVirtualUser(oldName, newName, password);
    m_unsaved = true;
    rebuild();
}

QString TreeModel::userName(const QModelIndex &index) const
{
    return index.isValid() ? itemOf(index)->label : QString();
}

bool TreeModel::isUserRow(const QModelIndex &index) const
{
    return index.isValid() && itemOf(index)->kind != Item::Kind::Group;
}

bool TreeModel::isGroupName(const QString &name) const
{
    const AppStrings &strings = AppStrings::instance();
    return name == strings.everybody || name == strings.localUsers || name == strings.virtualUsers
        || name == strings.anonymousUsers;
}

bool TreeModel::isInVirtualGroup(const QModelIndex &index) const
{
    return index.isValid() && itemOf(index)->parent == m_virtualUsers;
}

QModelIndex TreeModel::indexOfUser(const QString &name, int column) const
{
    for (const Item *group : {m_localUsers, m_virtualUsers, m_localUsers->parent}) {
        for (const auto &child : group->children) {
            if (child->kind != Item::Kind::Group && child->label == name)
                return createIndex(child->row, column, child.get());
        }
    }
    return {};
}

std::optional<AccessFailure> TreeModel::failure(const QModelIndex &index) const
{
    if (!isUserRow(index))
        return std::nullopt;
    Item &item = *itemOf(index);
    compute(item);
    return item.failure;
}

std::optional<UserForecast> TreeModel::forecast(const QModelIndex &index) const
{
    if (!isUserRow(index))
        return std::nullopt;
    return forecastOf(*itemOf(index));
}

void TreeModel::onSave()
{
    m_config->save();
    m_unsaved = false;
    m_config->setModified(false);
    // A save changes what it must (the userlist is always enabled).
    refreshAllUsers();
}

void TreeModel::markChanged()
{
    m_unsaved = true;
    m_config->setModified(true);
    refreshAllUsers();
}

void TreeModel::refreshAllUsers()
{
    m_forecast.reset();
    evaluateLater();
    const int last = columnCount() - 1;
    for (Item *group : {m_localUsers, m_virtualUsers, m_localUsers->parent}) {
        for (const auto &child : group->children)
            child->computed = false;
        if (!group->children.empty()) {
            emit dataChanged(createIndex(0, 0, group->children.front().get()),
                             createIndex(group->children.back()->row, last, group->children.back().get()));
        }
    }
    emit engineChanged();
}

void TreeModel::invalidData(const QString &reason)
{
    if (reason.isEmpty()) {
        m_interaction.show({Interaction::Icon::Warning, QString(),
                            tr("Unable to set data. Data is invalid. Reason is unknown"), QString(), QString()});
    } else {
        m_interaction.show(
            {Interaction::Icon::Warning, QString(), tr("Unable to set data. Data is invalid."), QString(), reason});
    }
}

bool TreeModel::setStatus(Item &item, bool allowed)
{
    if (item.kind == Item::Kind::Anonymous) {
        m_config->setOption("anonymous_enable", allowed ? "yes" : "no");
        return true;
    }
    const auto refuse = [this](const AccessFailure &failure) {
        m_interaction.show({Interaction::Icon::Warning, QString(), tr("Unable to change access status."),
                            tr("Failed check type: ") + failureKindText(failure.kind), failure.message});
        return false;
    };
    if (allowed) {
        AccessFailure failure;
        if (!m_config->checkAccess(item.name, true, &failure))
            return refuse(failure);
        return true;
    }
    m_config->blockUserByUserlist(item.name);
    if (m_config->checkAccess(item.name, false, nullptr))
        return refuse(AccessFailure());
    return true;
}

bool TreeModel::setDirectory(Item &item, const QString &directory)
{
    if (directory.isEmpty() || !directory.startsWith(QLatin1Char('/'))) {
        invalidData(tr("The directory must be an absolute path."));
        return false;
    }
    const QByteArray path = directory.toLocal8Bit();
    m_config->checkFolderPermissions(item.name, m_config->userRights(item.name), path);
    m_config->offerChroot(item.name, path);
    if (!m_config->setUserRoot(item.name, path))
        return false;
    return true;
}

bool TreeModel::setMode(Item &item, const QString &rights)
{
    m_config->checkFolderPermissions(item.name, rights.split(QStringLiteral(", ")));
    if (!m_config->setUserRights(item.name, rights)) {
        m_interaction.show(
            {Interaction::Icon::Warning, QString(), tr("Unable to change user permissions."), QString(), QString()});
        return false;
    }
    return true;
}

bool TreeModel::rename(Item &item, const QString &newName)
{
    if (newName == item.label)
        return false;
    if (item.parent != m_virtualUsers || !m_config->isVirtualUser(item.name)) {
        m_interaction.show(
            {Interaction::Icon::Warning, QString(),
             tr("You can change only virtual user names. Skipping change %1 to %2").arg(item.label, newName), QString(),
             QString()});
        return false;
    }
    const QByteArray name = newName.toUtf8();
    if (const auto reason = invalidNameReason(name)) {
        invalidData(*reason);
        return false;
    }
    if (m_config->isVirtualUser(name) || m_config->accounts().accounts().count(name)) {
        invalidData(tr("A user named %1 exists already.").arg(newName));
        return false;
    }
    changeVirtualUser(item.name, name, {});
    emit dataChanged(index(0, 0), index(0, 0));
    return true;
}
