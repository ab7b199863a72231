// Mail to the administrators: sendmail when the machine has one, else a spool file.
#include "corv/mail.h"

#include <fcntl.h>
#include <signal.h>
#include <stdio.h>
#include <string.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <time.h>
#include <unistd.h>

#include <string>

#include "corv/log.h"

namespace {

struct MailTemplate {
    const char* name;
    const char* subject;
    const char* body;
};

const MailTemplate kTemplates[] = {
    {"PKGUpgrade", "Package updates are available",
     "New versions of these packages can be installed: %PKG_SET%"},
};

const MailTemplate* findTemplate(const char* name) {
    for (const MailTemplate& t : kTemplates) {
        if (name != nullptr && strcmp(t.name, name) == 0) {
            return &t;
        }
    }
    return nullptr;
}

std::string fill(std::string text, PVLIBSZHASH fields) {
    if (fields == nullptr) {
        return text;
    }
    for (const auto& field : fields->values) {
        for (size_t at = text.find(field.first); !field.first.empty() && at != std::string::npos;
             at = text.find(field.first, at + field.second.size())) {
            text.replace(at, field.first.size(), field.second);
        }
    }
    return text;
}

std::string recipient() {
    char value[256] = {0};
    if (VLIBCFileGetKeyValue(VLIBC_INFO_PATH, "mail_admin", value, sizeof value, 0) > 0 &&
        value[0] != '\0') {
        return value;
    }
    return "root";
}

// The message with its headers, lines ended by line feeds.
std::string compose(const MailTemplate& t, PVLIBSZHASH fields) {
    char date[64] = {0};
    time_t now = time(nullptr);
    struct tm tm {};
    strftime(date, sizeof date, "%a, %d %b %Y %H:%M:%S %z", localtime_r(&now, &tm));
    std::string body = fill(t.body, fields);
    // A body line that begins with "From " would split the mbox.
    for (size_t at = body.find("\nFrom "); at != std::string::npos;
         at = body.find("\nFrom ", at + 2)) {
        body.insert(at + 1, ">");
    }
    return "To: " + recipient() + "\nSubject: " + fill(t.subject, fields) + "\nDate: " + date +
           "\nX-Corv-Template: " + t.name + "\n\n" + body + "\n";
}

int spool(const std::string& message) {
    CORVFSMkdirP("/var/spool/corv", nullptr, 1, -1, -1, 0755);
    int fd = open(CORV_MAIL_SPOOL, O_WRONLY | O_CREAT | O_APPEND | O_CLOEXEC, 0600);
    if (fd < 0) {
        CORV_LOG_ERR("Failed to open %s, %m", CORV_MAIL_SPOOL);
        VLIBCErrSet(ERR_WRITE_FAILED);
        return -1;
    }
    flock(fd, LOCK_EX);
    time_t now = time(nullptr);
    char stamp[64] = {0};
    ctime_r(&now, stamp);
    const std::string text = std::string("From corv-mail ") + stamp + message + "\n";
    const bool ok = write(fd, text.data(), text.size()) == static_cast<ssize_t>(text.size());
    flock(fd, LOCK_UN);
    close(fd);
    if (!ok) {
        CORV_LOG_ERR("Failed to write %s, %m", CORV_MAIL_SPOOL);
        VLIBCErrSet(ERR_WRITE_FAILED);
        return -1;
    }
    return 0;
}

// Hands the message to sendmail in a grandchild, so that the caller neither waits for the
// delivery nor leaves a zombie.
int sendmail(const std::string& message) {
    pid_t child = fork();
    if (child < 0) {
        CORV_LOG_ERR("Failed to fork, %m");
        VLIBCErrSet(ERR_CREATE_FAILED);
        return -1;
    }
    if (child == 0) {
        if (fork() != 0) {
            _exit(0);
        }
        FILE* pipe = VLIBCPopen(CORV_MAIL_SENDMAIL, "w", "-t", "-i", nullptr);
        if (pipe == nullptr) {
            _exit(1);
        }
        fwrite(message.data(), 1, message.size(), pipe);
        _exit(VLIBCPclose(pipe) == 0 ? 0 : 1);
    }
    waitpid(child, nullptr, 0);
    return 0;
}

}  // namespace

int CORVMailSendMessageWithoutBlock(const char* templateName, PVLIBSZHASH fields, int, int) {
    const MailTemplate* t = findTemplate(templateName);
    if (t == nullptr) {
        CORV_LOG_ERR("No mail template %s", templateName ? templateName : "(null)");
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return -1;
    }
    const std::string message = compose(*t, fields);
    if (access(CORV_MAIL_SENDMAIL, X_OK) == 0) {
        return sendmail(message);
    }
    return spool(message);
}
