// Job files and overrides: the subset of the upstart syntax of init_job.h, parsed line by
// line. Everything outside it is refused, with the line, so that a job that would not do
// what its text says never runs.
#include <fcntl.h>
#include <signal.h>
#include <string.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <string>
#include <vector>

#include "corv/log.h"
#include "corv/vlibc.h"
#include "init_job.h"

namespace CORVInit {

namespace {

// Job files are a few kilobytes; anything far larger is not one.
constexpr size_t kMaxJobFile = 1u << 20;

bool isBlank(char c) {
    return c == ' ' || c == '\t';
}

std::string trim(const std::string& s) {
    size_t begin = 0;
    size_t end = s.size();
    while (begin < end && isBlank(s[begin])) {
        ++begin;
    }
    while (end > begin && isBlank(s[end - 1])) {
        --end;
    }
    return s.substr(begin, end - begin);
}

bool allOf(const std::string& s, const char* extra, bool digitsFirst) {
    if (s.empty() || (!digitsFirst && isdigit(static_cast<unsigned char>(s[0])))) {
        return false;
    }
    return std::all_of(s.begin(), s.end(), [extra](char c) {
        return isalnum(static_cast<unsigned char>(c)) || strchr(extra, c) != nullptr;
    });
}

// A word of a stanza; `quoted` when any part of it was in double quotes, which makes
// "and" a value rather than the operator.
struct Word {
    std::string text;
    bool quoted = false;
};

// Splits at blanks; double quotes group (and are dropped), with no escapes inside.
bool splitWords(const std::string& line, std::vector<Word>* words, std::string* error) {
    words->clear();
    size_t i = 0;
    while (i < line.size()) {
        if (isBlank(line[i])) {
            ++i;
            continue;
        }
        Word word;
        while (i < line.size() && !isBlank(line[i])) {
            if (line[i] == '"') {
                size_t close = line.find('"', i + 1);
                if (close == std::string::npos) {
                    *error = "unterminated double quote";
                    return false;
                }
                word.text.append(line, i + 1, close - i - 1);
                word.quoted = true;
                i = close + 1;
            } else {
                word.text += line[i++];
            }
        }
        words->push_back(std::move(word));
    }
    return true;
}

// NAME=value of an event argument or an env stanza.
bool splitAssignment(const Word& word, std::pair<std::string, std::string>* out,
                     std::string* error) {
    size_t eq = word.text.find('=');
    if (eq == std::string::npos) {
        *error = "expected NAME=value, found '" + word.text + "'";
        return false;
    }
    out->first = word.text.substr(0, eq);
    out->second = word.text.substr(eq + 1);
    if (!IsValidVariableName(out->first)) {
        *error = "bad variable name '" + out->first + "'";
        return false;
    }
    return true;
}

// EVENT [and EVENT]..., the words after "start on" or "stop on".
bool parseCondition(const std::vector<Word>& words, size_t from, Condition* condition,
                    std::string* error) {
    condition->clear();
    bool expectTerm = true;
    for (size_t i = from; i < words.size(); ++i) {
        const Word& word = words[i];
        if (!word.quoted && (word.text == "or" || word.text.find_first_of("()") == 0)) {
            *error = "only conditions joined with 'and' are supported, found '" + word.text + "'";
            return false;
        }
        if (!word.quoted && word.text == "and") {
            if (expectTerm) {
                *error = "'and' without an event before it";
                return false;
            }
            expectTerm = true;
            continue;
        }
        if (expectTerm) {
            if (word.quoted || !IsValidEventName(word.text)) {
                *error = "bad event name '" + word.text + "'";
                return false;
            }
            condition->push_back(EventMatch{word.text, {}});
            expectTerm = false;
            EventMatch& term = condition->back();
            // `started JOB` and `stopped JOB` name the job without its variable name.
            if ((term.name == "started" || term.name == "stopped") && i + 1 < words.size() &&
                words[i + 1].text.find('=') == std::string::npos) {
                const std::string& job = words[++i].text;
                if (!IsValidJobName(job)) {
                    *error = "bad job name '" + job + "' after '" + term.name + "'";
                    return false;
                }
                term.args.emplace_back("JOB", job);
            }
            continue;
        }
        std::pair<std::string, std::string> arg;
        if (!splitAssignment(word, &arg, error)) {
            *error = "event " + condition->back().name + ": " + *error;
            return false;
        }
        condition->back().args.push_back(std::move(arg));
    }
    if (condition->empty()) {
        *error = "no event given";
        return false;
    }
    if (expectTerm) {
        *error = "'and' without an event after it";
        return false;
    }
    return true;
}

int signalNamed(std::string name) {
    if (name.compare(0, 3, "SIG") == 0) {
        name.erase(0, 3);
    }
    static const struct {
        const char* name;
        int signal;
    } kSignals[] = {{"TERM", SIGTERM}, {"INT", SIGINT},   {"QUIT", SIGQUIT}, {"HUP", SIGHUP},
                    {"KILL", SIGKILL}, {"USR1", SIGUSR1}, {"USR2", SIGUSR2}};
    for (const auto& entry : kSignals) {
        if (name == entry.name) {
            return entry.signal;
        }
    }
    return 0;
}

// The rest of the line after its first word and the blanks that follow it.
std::string restAfterFirstWord(const std::string& line) {
    size_t i = 0;
    while (i < line.size() && isBlank(line[i])) {
        ++i;
    }
    while (i < line.size() && !isBlank(line[i])) {
        ++i;
    }
    return trim(line.substr(i));
}

class Parser {
  public:
    Parser(const std::string& text, Job* job) : job_(job) { splitLines(text); }

    bool run(std::string* error) {
        for (index_ = 0; index_ < lines_.size(); ++index_) {
            const std::string& line = lines_[index_];
            if (line.find('\r') != std::string::npos || line.find('\0') != std::string::npos) {
                return fail(error, "carriage return or NUL byte in the line");
            }
            std::string content = trim(line);
            if (content.empty() || content[0] == '#') {
                continue;
            }
            std::string reason;
            if (!stanza(content, &reason)) {
                return fail(error, reason);
            }
        }
        if (job_->postStart.present && !job_->main.present) {
            index_ = static_cast<size_t>(job_->postStart.line - 1);
            return fail(error, "post-start without a main process (exec or script)");
        }
        return true;
    }

  private:
    void splitLines(const std::string& text) {
        size_t start = 0;
        while (start < text.size()) {
            size_t end = text.find('\n', start);
            if (end == std::string::npos) {
                end = text.size();
            }
            lines_.push_back(text.substr(start, end - start));
            start = end + 1;
        }
    }

    bool fail(std::string* error, const std::string& reason) {
        *error = "line " + std::to_string(index_ + 1) + ": " + reason;
        return false;
    }

    bool stanza(const std::string& content, std::string* reason) {
        std::vector<Word> words;
        if (!splitWords(content, &words, reason)) {
            return false;
        }
        const std::string& keyword = words[0].text;
        if (words[0].quoted) {
            *reason = "a stanza cannot be quoted";
            return false;
        }
        if (keyword == "start" || keyword == "stop") {
            return condition(words, keyword == "start" ? &job_->startOn : &job_->stopOn, reason);
        }
        if (keyword == "cgroup") {
            if (words.size() < 2 || words.size() > 3 || !allOf(words[1].text, "_", false)) {
                *reason = "expected 'cgroup CONTROLLER \"NAME\"'";
                return false;
            }
            return true;
        }
        if (keyword == "console") {
            if (words.size() != 2 || (words[1].text != "log" && words[1].text != "none")) {
                *reason = "expected 'console log' or 'console none'";
                return false;
            }
            job_->consoleLog = words[1].text == "log";
            return true;
        }
        if (keyword == "env") {
            return env(words, reason);
        }
        if (keyword == "script") {
            return process(words, &job_->main, "script", content, reason);
        }
        if (keyword == "exec") {
            return process(words, &job_->main, "exec", content, reason);
        }
        if (keyword == "pre-start" || keyword == "post-start" || keyword == "post-stop") {
            Process* target = keyword == "pre-start"    ? &job_->preStart
                              : keyword == "post-start" ? &job_->postStart
                                                        : &job_->postStop;
            return process(words, target, keyword, content, reason);
        }
        if (keyword == "reload") {
            return reload(words, content, reason);
        }
        if (keyword == "kill") {
            int signal =
                words.size() == 3 && words[1].text == "signal" ? signalNamed(words[2].text) : 0;
            if (signal == 0) {
                *reason = "expected 'kill signal TERM|INT|QUIT|HUP|KILL|USR1|USR2'";
                return false;
            }
            job_->killSignal = signal;
            return true;
        }
        if (keyword == "end") {
            *reason = "'" + content + "' without a script to end";
            return false;
        }
        *reason = "unknown stanza '" + keyword + "'";
        return false;
    }

    bool condition(const std::vector<Word>& words, Condition* target, std::string* reason) {
        const std::string& keyword = words[0].text;
        if (words.size() < 2 || words[1].text != "on") {
            *reason = "expected '" + keyword + " on EVENT'";
            return false;
        }
        if (!target->empty()) {
            *reason = "a second '" + keyword + " on'";
            return false;
        }
        return parseCondition(words, 2, target, reason);
    }

    bool env(const std::vector<Word>& words, std::string* reason) {
        if (words.size() != 2) {
            *reason = "expected 'env NAME=\"value\"'";
            return false;
        }
        std::pair<std::string, std::string> variable;
        if (!splitAssignment(words[1], &variable, reason)) {
            return false;
        }
        // Later stanzas win, as in the shell.
        auto same = [&](const auto& entry) { return entry.first == variable.first; };
        job_->env.erase(std::remove_if(job_->env.begin(), job_->env.end(), same), job_->env.end());
        job_->env.push_back(std::move(variable));
        return true;
    }

    // `<kind> script` (then the body) or `<kind> exec COMMAND`; the main process has no
    // kind word before "script" or "exec".
    bool process(const std::vector<Word>& words, Process* target, const std::string& kind,
                 const std::string& content, std::string* reason) {
        const bool main = target == &job_->main;
        const size_t form = main ? 0 : 1;
        if (words.size() <= form || (words[form].text != "script" && words[form].text != "exec")) {
            *reason = "expected '" + kind + " script' or '" + kind + " exec COMMAND'";
            return false;
        }
        if (target->present) {
            *reason = main ? "a second main process (exec or script)" : "a second " + kind;
            return false;
        }
        target->present = true;
        target->line = static_cast<int>(index_ + 1);
        if (words[form].text == "exec") {
            target->isScript = false;
            target->text = main ? restAfterFirstWord(content)
                                : restAfterFirstWord(restAfterFirstWord(content));
            if (target->text.empty()) {
                *reason = "exec without a command line";
                return false;
            }
            return true;
        }
        if (words.size() != form + 1) {
            *reason = "nothing may follow 'script' on its line";
            return false;
        }
        target->isScript = true;
        const size_t opener = index_;
        for (++index_; index_ < lines_.size(); ++index_) {
            if (trim(lines_[index_]) == "end script") {
                return true;
            }
            if (lines_[index_].find('\0') != std::string::npos) {
                *reason = "NUL byte in the script";
                return false;
            }
            target->text += lines_[index_];
            target->text += '\n';
        }
        index_ = opener;
        *reason = "'" + content + "' is not closed by 'end script'";
        return false;
    }

    bool reload(const std::vector<Word>& words, const std::string& content, std::string* reason) {
        if (words.size() < 2) {
            *reason = "reload without a command line";
            return false;
        }
        if (words[1].text == "signal") {
            *reason = "'reload signal' is not supported; give the command line that reloads";
            return false;
        }
        if (!job_->reload.empty()) {
            *reason = "a second reload";
            return false;
        }
        job_->reload = restAfterFirstWord(content);
        return true;
    }

    Job* job_;
    std::vector<std::string> lines_;
    size_t index_ = 0;
};

}  // namespace

bool IsValidJobName(const std::string& name) {
    return name.size() <= 200 && allOf(name, "-_.+@", true) && name[0] != '.';
}

bool IsValidEventName(const std::string& name) {
    return name.size() <= 200 && allOf(name, "-_.", true);
}

bool IsValidVariableName(const std::string& name) {
    return allOf(name, "_", false);
}

bool ParseJob(const std::string& text, Job* job, std::string* error) {
    std::string name = job->name;
    *job = Job();
    job->name = std::move(name);
    Parser parser(text, job);
    return parser.run(error);
}

bool ParseOverride(const std::string& text, bool* manual, std::string* error) {
    *manual = false;
    size_t start = 0;
    for (int number = 1; start < text.size(); ++number) {
        size_t end = text.find('\n', start);
        if (end == std::string::npos) {
            end = text.size();
        }
        std::string content = trim(text.substr(start, end - start));
        start = end + 1;
        if (content.empty() || content[0] == '#') {
            continue;
        }
        if (content != "manual") {
            *error = "line " + std::to_string(number) + ": only 'manual' may be overridden";
            return false;
        }
        *manual = true;
    }
    return true;
}

std::string JobFilePath(const std::string& name) {
    return std::string(kJobDir) + "/" + name + ".conf";
}

std::string OverridePath(const std::string& name) {
    return std::string(kJobDir) + "/" + name + ".override";
}

bool ReadTextFile(const std::string& path, std::string* text) {
    text->clear();
    int fd = open(path.c_str(), O_RDONLY | O_CLOEXEC);
    if (fd < 0) {
        return false;
    }
    char buffer[8192];
    ssize_t n = 0;
    // Reading stops past the limit: the caller refuses the size, not the file.
    while (text->size() <= kMaxJobFile && (n = VLIBCRead(fd, buffer, sizeof buffer)) > 0) {
        text->append(buffer, static_cast<size_t>(n));
    }
    close(fd);
    return n >= 0;
}

int LoadJob(const std::string& name, Job* job, bool* manual, std::string* error) {
    if (!IsValidJobName(name)) {
        *error = "bad job name '" + name + "'";
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return -1;
    }
    const std::string path = JobFilePath(name);
    std::string text;
    if (!ReadTextFile(path, &text)) {
        *error = "Unknown job: " + name;
        VLIBCErrSet(ERR_NO_SUCH_FILE);
        return -1;
    }
    job->name = name;
    std::string reason;
    if (text.size() > kMaxJobFile || !ParseJob(text, job, &reason)) {
        *error = path + ": " + (reason.empty() ? "too large for a job file" : reason);
        VLIBCErrSet(ERR_MALFORMED);
        return -1;
    }
    const std::string overridePath = OverridePath(name);
    *manual = false;
    if (VLIBCFileExist(overridePath.c_str())) {
        if (!ReadTextFile(overridePath, &text)) {
            *error = overridePath + ": unreadable";
            VLIBCErrSet(ERR_READ_FAILED);
            return -1;
        }
        if (!ParseOverride(text, manual, &reason)) {
            *error = overridePath + ": " + reason;
            VLIBCErrSet(ERR_MALFORMED);
            return -1;
        }
    }
    return 0;
}

bool CheckJobFile(const std::string& path, std::string* error) {
    std::string text;
    if (!ReadTextFile(path, &text)) {
        *error = path + ": cannot be read";
        VLIBCErrSet(ERR_NO_SUCH_FILE);
        return false;
    }
    Job job;
    std::string reason;
    if (text.size() > kMaxJobFile || !ParseJob(text, &job, &reason)) {
        *error = path + ": " + (reason.empty() ? "too large for a job file" : reason);
        VLIBCErrSet(ERR_MALFORMED);
        return false;
    }
    return true;
}

std::vector<std::string> ListJobs() {
    std::vector<std::string> names;
    PVLIBSZLIST files = VLIBCSzListAlloc(64);
    if (files == nullptr) {
        return names;
    }
    if (VLIBCFileCheckDir(kJobDir)) {
        int count = VLIBCFileEnumDir(kJobDir, ".conf", &files, 0);
        for (int i = 0; i < count; ++i) {
            std::string name(VLIBCSzListGet(files, i));
            name.resize(name.size() - strlen(".conf"));
            if (IsValidJobName(name)) {
                names.push_back(std::move(name));
            }
        }
    }
    VLIBCSzListFree(files);
    return names;
}

}  // namespace CORVInit
