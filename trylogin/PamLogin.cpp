#include "TryLogin.h"

#include <QCoreApplication>
#include <QStringList>

#include <security/pam_appl.h>

#include <cstdlib>
#include <cstring>

namespace {

QString tr(const char *text)
{
    return QCoreApplication::translate("TryLogin", text);
}

struct Conversation
{
    const QByteArray *password;
    QStringList messages;
};

// Answers as vsftpd does: the password to a prompt without echo, nothing
// to information and errors (kept for the dialog), and no answer to a
// prompt with echo.
int converse(int count, const struct pam_message **messages, struct pam_response **responses, void *data)
{
    auto *conversation = static_cast<Conversation *>(data);
    auto *answers = static_cast<pam_response *>(std::calloc(size_t(count), sizeof(pam_response)));
    if (!answers)
        return PAM_BUF_ERR;
    for (int i = 0; i < count; ++i) {
        switch (messages[i]->msg_style) {
        case PAM_PROMPT_ECHO_OFF: {
            const QByteArray &password = *conversation->password;
            // libpam frees the answer, after pam_unix has overwritten it.
            auto *copy = static_cast<char *>(std::malloc(size_t(password.size()) + 1));
            if (!copy) {
                for (int j = 0; j < i; ++j)
                    std::free(answers[j].resp);
                std::free(answers);
                return PAM_BUF_ERR;
            }
            std::memcpy(copy, password.constData(), size_t(password.size()));
            copy[password.size()] = '\0';
            answers[i].resp = copy;
            break;
        }
        case PAM_TEXT_INFO:
        case PAM_ERROR_MSG:
            if (messages[i]->msg)
                conversation->messages << QString::fromLocal8Bit(messages[i]->msg);
            break;
        default:
            for (int j = 0; j < i; ++j)
                std::free(answers[j].resp);
            std::free(answers);
            return PAM_CONV_ERR;
        }
    }
    *responses = answers;
    return PAM_SUCCESS;
}

// pam_unix and pam_faildelay make a refusal wait seconds to slow down a
// guesser at the server; the administrator here waits for the answer only.
void noDelay(int, unsigned, void *)
{
}

} // namespace

void tryPamLogin(const TryLoginRequest &request, const TryLoginReport &report)
{
    using Outcome = TryLoginStep::Outcome;
    auto step = [&](const QString &command, Outcome outcome, const QString &text) {
        report({TryLoginStep::Stage::Pam, command, outcome, text});
    };
    if (!request.skipReason.isEmpty()) {
        step(QStringLiteral("pam_start"), Outcome::Skipped, request.skipReason);
        return;
    }
    if (request.anonymous) {
        step(QStringLiteral("pam_start"), Outcome::Skipped,
             tr("Not run: vsftpd lets anonymous sessions in without PAM."));
        return;
    }
    Conversation conversation{&request.password, {}};
    const pam_conv conv{&converse, &conversation};
    pam_handle_t *handle = nullptr;
    const QString service = QString::fromLocal8Bit(request.pamService);
    int status = pam_start(request.pamService.constData(), request.user.constData(), &conv, &handle);
    if (status != PAM_SUCCESS) {
        step(QStringLiteral("pam_start"), Outcome::Failed, QString::fromLocal8Bit(pam_strerror(handle, status)));
        if (handle)
            pam_end(handle, status);
        return;
    }
    step(QStringLiteral("pam_start"), Outcome::Passed, tr("Service \"%1\", /etc/pam.d/%1").arg(service));
    // What vsftpd sets before it authenticates: modules such as pam_access
    // and pam_time look at them.
    pam_set_item(handle, PAM_TTY, "ftp");
    pam_set_item(handle, PAM_RHOST, "127.0.0.1");
    pam_set_item(handle, PAM_FAIL_DELAY, reinterpret_cast<const void *>(&noDelay));

    auto withMessages = [&](int code) {
        QString text = QString::fromLocal8Bit(pam_strerror(handle, code));
        if (!conversation.messages.isEmpty())
            text += QStringLiteral(" (") + conversation.messages.join(QStringLiteral("; ")) + QLatin1Char(')');
        conversation.messages.clear();
        return text;
    };
    status = pam_authenticate(handle, 0);
    step(QStringLiteral("pam_authenticate"), status == PAM_SUCCESS ? Outcome::Passed : Outcome::Failed,
         withMessages(status));
    if (status == PAM_SUCCESS) {
        status = pam_acct_mgmt(handle, 0);
        step(QStringLiteral("pam_acct_mgmt"), status == PAM_SUCCESS ? Outcome::Passed : Outcome::Failed,
             withMessages(status));
    } else {
        step(QStringLiteral("pam_acct_mgmt"), Outcome::Skipped,
             tr("Not run: vsftpd refuses the login after a failed authentication."));
    }
    pam_end(handle, status);
}
