// Key-value files: one `key="value"` line per key, other lines kept as they are.
//
// A write builds the whole new file beside the old one and renames it into place, so a
// reader (which takes no lock) sees either file complete, and a crash leaves one of the
// two. Writers take an exclusive lock on the directory so that two read-modify-writes
// in different processes cannot drop each other's keys.
#include <cerrno>
#include <cstdio>
#include <cstring>
#include <fcntl.h>
#include <optional>
#include <string>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include "platform/navocore.h"

namespace {

class Fd {
  public:
    explicit Fd(int fd) : fd_(fd) {}
    ~Fd() {
        if (fd_ >= 0)
            ::close(fd_);
    }
    Fd(const Fd &) = delete;
    Fd &operator=(const Fd &) = delete;
    int get() const { return fd_; }
    // Closes now, reporting the result (a failed close can mean lost data).
    int close() {
        int rc = ::close(fd_);
        fd_ = -1;
        return rc;
    }

  private:
    int fd_;
};

bool fail(int code) {
    NLIBCErrSet(code);
    return false;
}

// The whole file; an absent file reads as empty with `exists` false.
bool read_file(const char *path, std::string &out, bool &exists) {
    Fd fd(::open(path, O_RDONLY | O_CLOEXEC));
    exists = fd.get() >= 0;
    if (!exists)
        return errno == ENOENT || fail(kNavoErrSystem);
    char buf[4096];
    for (;;) {
        ssize_t n = ::read(fd.get(), buf, sizeof buf);
        if (n < 0 && errno == EINTR)
            continue;
        if (n < 0)
            return fail(kNavoErrSystem);
        if (n == 0)
            return true;
        out.append(buf, static_cast<size_t>(n));
    }
}

bool write_all(int fd, const std::string &data) {
    size_t done = 0;
    while (done < data.size()) {
        ssize_t n = ::write(fd, data.data() + done, data.size() - done);
        if (n < 0 && errno == EINTR)
            continue;
        if (n < 0)
            return false;
        done += static_cast<size_t>(n);
    }
    return true;
}

// The value when `line` (without its newline) holds `key`; one pair of surrounding
// double quotes is taken off, so quotes inside a value survive.
std::optional<std::string> value_of(const std::string &line, const char *key) {
    size_t klen = std::strlen(key);
    if (line.size() <= klen || line.compare(0, klen, key) != 0 || line[klen] != '=')
        return std::nullopt;
    std::string value = line.substr(klen + 1);
    if (!value.empty() && value.back() == '\r')
        value.pop_back();
    if (value.size() >= 2 && value.front() == '"' && value.back() == '"')
        value = value.substr(1, value.size() - 2);
    return value;
}

// Calls `visit(line, has_newline)` for each line of `text`.
template <typename Visit> void each_line(const std::string &text, Visit visit) {
    size_t start = 0;
    while (start < text.size()) {
        size_t end = text.find('\n', start);
        bool newline = end != std::string::npos;
        if (!newline)
            end = text.size();
        visit(text.substr(start, end - start), newline);
        start = end + 1;
    }
}

// -1 failure, 0 absent, 1 found with the first value of the key in `value`.
int read_value(const char *file, const char *key, std::string &value) {
    if (file == nullptr || key == nullptr || *key == '\0') {
        NLIBCErrSet(kNavoErrBadParam);
        return -1;
    }
    std::string text;
    bool exists = false;
    if (!read_file(file, text, exists))
        return -1;
    int found = 0;
    each_line(text, [&](const std::string &line, bool) {
        if (found != 0)
            return;
        if (auto v = value_of(line, key)) {
            value = *v;
            found = 1;
        }
    });
    return found;
}

// The line `format` makes of key and value: two "%s", "%%" and plain text only, one
// line ending in a newline. Anything else could inject further lines or read stray
// arguments.
std::optional<std::string> format_line(const char *format, const char *key, const char *value) {
    const char *args[] = {key, value};
    size_t used = 0;
    std::string line;
    for (const char *p = format; *p != '\0'; ++p) {
        if (*p != '%') {
            line += *p;
        } else if (p[1] == '%') {
            line += '%';
            ++p;
        } else if (p[1] == 's' && used < 2) {
            line += args[used++];
            ++p;
        } else {
            return std::nullopt;
        }
    }
    if (used != 2)
        return std::nullopt;
    if (line.empty() || line.back() != '\n')
        line += '\n';
    if (line.find('\n') != line.size() - 1)
        return std::nullopt;
    return line;
}

std::string directory_of(const std::string &file) {
    size_t slash = file.rfind('/');
    if (slash == std::string::npos)
        return ".";
    return slash == 0 ? "/" : file.substr(0, slash);
}

// The new text: the key's first line replaced by `line`, its later lines dropped.
std::string replaced(const std::string &old_text, const char *key, const std::string &line) {
    std::string text;
    bool done = false;
    each_line(old_text, [&](const std::string &current, bool newline) {
        if (value_of(current, key)) {
            if (!done)
                text += line;
            done = true;
            return;
        }
        text += current;
        if (newline)
            text += '\n';
    });
    if (!done) {
        if (!text.empty() && text.back() != '\n')
            text += '\n';
        text += line;
    }
    return text;
}

// Writes `text` as `file` through a temporary file in the same directory.
bool replace_file(const std::string &file, const std::string &dir, const std::string &text,
                  const struct stat *old) {
    std::string tmp = file + ".XXXXXX";
    Fd fd(mkostemp(tmp.data(), O_CLOEXEC));
    if (fd.get() < 0)
        return fail(kNavoErrSystem);
    mode_t mode = old != nullptr ? (old->st_mode & 07777) : 0644;
    bool ok = fchmod(fd.get(), mode) == 0;
    // Keep the owner too; only a privileged writer can, and others keep their own.
    if (ok && old != nullptr && (old->st_uid != geteuid() || old->st_gid != getegid()))
        (void)fchown(fd.get(), old->st_uid, old->st_gid);
    ok = ok && write_all(fd.get(), text) && fsync(fd.get()) == 0;
    ok = fd.close() == 0 && ok;
    ok = ok && std::rename(tmp.c_str(), file.c_str()) == 0;
    if (!ok) {
        ::unlink(tmp.c_str());
        return fail(kNavoErrSystem);
    }
    // The rename itself reaches the disk with the directory.
    Fd dfd(::open(dir.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    if (dfd.get() >= 0)
        fsync(dfd.get());
    return true;
}

bool set_value(const char *file, const char *key, const char *value, const char *format) {
    if (std::strpbrk(key, "=\r\n") != nullptr || std::strpbrk(value, "\r\n") != nullptr)
        return fail(kNavoErrBadParam);
    std::optional<std::string> line = format_line(format, key, value);
    if (!line)
        return fail(kNavoErrBadParam);
    std::string dir = directory_of(file);
    Fd lock(::open(dir.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    if (lock.get() < 0 || flock(lock.get(), LOCK_EX) != 0)
        return fail(kNavoErrSystem);
    std::string text;
    bool exists = false;
    if (!read_file(file, text, exists))
        return false;
    struct stat st;
    if (exists && stat(file, &st) != 0)
        return fail(kNavoErrSystem);
    return replace_file(file, dir, replaced(text, key, *line), exists ? &st : nullptr);
}

} // namespace

int NLIBCFileGetKeyValue(const char *file, const char *key, char *buf, int size,
                         int flags) noexcept {
    if (buf == nullptr || size < 1 || flags != 0) {
        NLIBCErrSet(kNavoErrBadParam);
        return -1;
    }
    try {
        std::string value;
        int rc = read_value(file, key, value);
        if (rc == 1)
            std::snprintf(buf, static_cast<size_t>(size), "%s", value.c_str());
        return rc;
    } catch (const std::bad_alloc &) {
        NLIBCErrSet(kNavoErrNoMemory);
        return -1;
    }
}

int NLIBCFileSetKeyValue(const char *file, const char *key, const char *value,
                         const char *line_format) noexcept {
    if (file == nullptr || key == nullptr || *key == '\0' || value == nullptr ||
        line_format == nullptr) {
        NLIBCErrSet(kNavoErrBadParam);
        return -1;
    }
    try {
        return set_value(file, key, value, line_format) ? 0 : -1;
    } catch (const std::bad_alloc &) {
        NLIBCErrSet(kNavoErrNoMemory);
        return -1;
    }
}

int NLIBCFileCheckKeyValue(const char *file, const char *key, const char *value,
                           int flags) noexcept {
    if (value == nullptr || flags != 0)
        return 0;
    try {
        std::string stored;
        return read_value(file, key, stored) == 1 && stored == value ? 1 : 0;
    } catch (const std::bad_alloc &) {
        return 0;
    }
}
