#include "VsftpdSettings.h"

#include <QSet>

#include <optional>
#include <sstream>

namespace {

// The settings vsftpd 3.0.3 as Debian 12 builds it knows, by kind.
const QSet<QByteArray> &boolKeys()
{
    static const QSet<QByteArray> keys{
        "allow_anon_ssl",
        "allow_writeable_chroot",
        "anon_mkdir_write_enable",
        "anon_other_write_enable",
        "anon_upload_enable",
        "anon_world_readable_only",
        "anonymous_enable",
        "ascii_download_enable",
        "ascii_upload_enable",
        "async_abor_enable",
        "background",
        "check_shell",
        "chmod_enable",
        "chown_uploads",
        "chroot_list_enable",
        "chroot_local_user",
        "connect_from_port_20",
        "debug_ssl",
        "delete_failed_uploads",
        "deny_email_enable",
        "dirlist_enable",
        "dirmessage_enable",
        "download_enable",
        "dual_log_enable",
        "force_anon_data_ssl",
        "force_anon_logins_ssl",
        "force_dot_files",
        "force_local_data_ssl",
        "force_local_logins_ssl",
        "ftp_enable",
        "guest_enable",
        "hide_ids",
        "http_enable",
        "implicit_ssl",
        "isolate",
        "isolate_network",
        "listen",
        "listen_ipv6",
        "local_enable",
        "lock_upload_files",
        "log_ftp_protocol",
        "ls_recurse_enable",
        "mdtm_write",
        "no_anon_password",
        "no_log_lock",
        "one_process_model",
        "passwd_chroot_enable",
        "pasv_addr_resolve",
        "pasv_enable",
        "pasv_promiscuous",
        "port_enable",
        "port_promiscuous",
        "ptrace_sandbox",
        "require_cert",
        "require_ssl_reuse",
        "run_as_launching_user",
        "seccomp_sandbox",
        "secure_email_list_enable",
        "session_support",
        "setproctitle_enable",
        "ssl_enable",
        "ssl_request_cert",
        "ssl_sslv2",
        "ssl_sslv3",
        "ssl_tlsv1",
        "strict_ssl_read_eof",
        "strict_ssl_write_shutdown",
        "syslog_enable",
        "tcp_wrappers",
        "text_userdb_names",
        "tilde_user_enable",
        "use_localtime",
        "use_sendfile",
        "userlist_deny",
        "userlist_enable",
        "utf8_filesystem",
        "validate_cert",
        "virtual_use_local_privs",
        "write_enable",
        "xferlog_enable",
        "xferlog_std_format",
    };
    return keys;
}

const QSet<QByteArray> &numberKeys()
{
    static const QSet<QByteArray> keys{
        "accept_timeout",       "anon_max_rate",
        "anon_umask",           "chown_upload_mode",
        "connect_timeout",      "data_connection_timeout",
        "delay_failed_login",   "delay_successful_login",
        "file_open_mode",       "ftp_data_port",
        "idle_session_timeout", "listen_port",
        "local_max_rate",       "local_umask",
        "max_clients",          "max_login_fails",
        "max_per_ip",           "pasv_max_port",
        "pasv_min_port",        "trans_chunk_size",
    };
    return keys;
}

const QSet<QByteArray> &stringKeys()
{
    static const QSet<QByteArray> keys{
        "anon_root",           "banned_email_file",    "banner_file",       "ca_certs_file",
        "chown_username",      "chroot_list_file",     "cmds_allowed",      "cmds_denied",
        "deny_file",           "download_file",        "dsa_cert_file",     "dsa_private_key_file",
        "email_password_file", "ftp_username",         "ftpd_banner",       "guest_username",
        "hide_file",           "listen_address",       "listen_address6",   "local_root",
        "message_file",        "nopriv_user",          "pam_service_name",  "pasv_address",
        "rsa_cert_file",       "rsa_private_key_file", "secure_chroot_dir", "ssl_ciphers",
        "upload_file",         "user_config_dir",      "user_sub_token",    "userlist_file",
        "vsftpd_log_file",     "xferlog_file",
    };
    return keys;
}

std::optional<bool> boolValue(const QByteArray &value)
{
    const QByteArray upper = value.toUpper();
    if (upper == "YES" || upper == "TRUE" || upper == "1")
        return true;
    if (upper == "NO" || upper == "FALSE" || upper == "0")
        return false;
    return std::nullopt;
}

QByteArray blanks(int columns)
{
    std::ostringstream out;
    writeIndent(out, columns);
    return QByteArray::fromStdString(out.str());
}

QString shown(const QByteArray &text)
{
    return QString::fromUtf8(text).replace(QLatin1Char('\t'), QLatin1String("\\t"));
}

} // namespace

VsftpdSettings::VsftpdSettings(const ConfigElementList &elements)
{
    const auto comment = [this](const ConfigElementPtr &element) {
        // vsftpd skips a comment only when "#" is the line's first character.
        if (element->xOffset() > 0) {
            std::ostringstream text;
            element->print(text);
            const bool equals = text.str().find('=') != std::string::npos;
            m_errors.append({element->yOffset() + 1,
                             QStringLiteral("the comment is indented: vsftpd reads the line "
                                            "as a setting and stops (%1)")
                                 .arg(equals ? QStringLiteral("unrecognised variable")
                                             : QStringLiteral("missing value in config file"))});
        }
    };
    for (const auto &element : elements) {
        const int line = element->yOffset() + 1;
        if (auto commentable = std::dynamic_pointer_cast<ConfigElementCommentable>(element)) {
            for (const auto &block : commentable->comments) {
                for (const auto &c : std::static_pointer_cast<ConfigElementCommentBlock>(block)->comments)
                    comment(c);
            }
        }
        switch (element->type()) {
        case ElementType::ELine:
            break;
        case ElementType::Comment:
            comment(element);
            break;
        case ElementType::CommentBlock:
            for (const auto &c : std::static_pointer_cast<ConfigElementCommentBlock>(element)->comments)
                comment(c);
            break;
        case ElementType::Data: {
            const auto data = std::static_pointer_cast<ConfigElementData>(element);
            // Blanks before a setting are passed over; blanks around "=" are
            // kept as part of the key or the value.
            const QByteArray key = QByteArray::fromStdString(data->key) + blanks(data->gapBefore);
            readLine(key, blanks(data->gapAfter) + QByteArray::fromStdString(data->value), line);
            break;
        }
        case ElementType::Expr: {
            const auto expr = std::static_pointer_cast<ConfigElementExpr>(element);
            QByteArray words;
            for (const auto &token : expr->tokens)
                words += (words.isEmpty() ? "" : " ") + QByteArray::fromStdString(token.text);
            m_errors.append(
                {line,
                 QStringLiteral("\"%1\" has no \"=\": vsftpd stops (missing value in config file)").arg(shown(words))});
            break;
        }
        default: {
            std::ostringstream text;
            element->print(text);
            QByteArray whole = QByteArray::fromStdString(text.str()).trimmed();
            whole = whole.mid(whole.lastIndexOf('\n') + 1);
            m_errors.append(
                {line, QStringLiteral("\"%1\" is no setting: vsftpd stops (unrecognised variable)").arg(shown(whole))});
            break;
        }
        }
    }
}

void VsftpdSettings::readLine(const QByteArray &key, const QByteArray &value, int line)
{
    const Kind kind = kindOf(key);
    if (kind == Kind::Unknown) {
        m_errors.append({line,
                         QStringLiteral("unknown setting \"%1\": vsftpd stops (unrecognised variable in "
                                        "config file)")
                             .arg(shown(key))});
        return;
    }
    if (kind == Kind::Bool && !boolValue(value)) {
        m_errors.append({line,
                         QStringLiteral("%1=\"%2\" is not a yes/no value: vsftpd stops (bad bool value in "
                                        "config file)")
                             .arg(shown(key), shown(value))});
        return;
    }
    const auto it = m_settings.constFind(key);
    if (it != m_settings.constEnd() && it->value != value) {
        m_repeats.append({line,
                          QStringLiteral("%1 is set again here (first on line %2): vsftpd uses this last "
                                         "value, \"%3\"; this program's verdict reads the first, \"%4\"")
                              .arg(shown(key))
                              .arg(it->line)
                              .arg(shown(value), shown(it->value))});
    }
    m_settings[key] = {value, line};
}

VsftpdSettings::Kind VsftpdSettings::kindOf(const QByteArray &key)
{
    if (boolKeys().contains(key))
        return Kind::Bool;
    if (numberKeys().contains(key))
        return Kind::Number;
    if (stringKeys().contains(key))
        return Kind::String;
    return Kind::Unknown;
}

const QList<VsftpdSettings::Problem> &VsftpdSettings::errors() const
{
    return m_errors;
}

void VsftpdSettings::addError(int line, const QString &message)
{
    m_errors.append({line, message});
}

const QList<VsftpdSettings::Problem> &VsftpdSettings::repeats() const
{
    return m_repeats;
}

bool VsftpdSettings::contains(const QByteArray &key) const
{
    return m_settings.contains(key);
}

const VsftpdSettings::Setting *VsftpdSettings::find(const QByteArray &key) const
{
    const auto it = m_settings.constFind(key);
    return it == m_settings.constEnd() ? nullptr : &it.value();
}

QByteArray VsftpdSettings::value(const QByteArray &key, const QByteArray &defaultValue) const
{
    const Setting *setting = find(key);
    return setting ? setting->value : defaultValue;
}

bool VsftpdSettings::isYes(const QByteArray &key, bool defaultValue) const
{
    const Setting *setting = find(key);
    return setting ? boolValue(setting->value).value_or(defaultValue) : defaultValue;
}

int VsftpdSettings::line(const QByteArray &key) const
{
    const Setting *setting = find(key);
    return setting ? setting->line : 0;
}
