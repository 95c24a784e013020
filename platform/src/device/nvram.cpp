// The NVRAM library on the host: numbered record files under <root>/nvram/.
//
// A handle opened for writing works on a private copy of the file, which
// NVM_CloseFileDesc renames over the store: a reader, or a restart after a crash
// in the middle of a write, sees the whole old record or the whole new one.
#include <libnvram.h>
#include <tolk_platform/device_root.h>
#include <tolk_platform/file_util.h>

#include <errno.h>
#include <fcntl.h>
#include <limits.h>
#include <stdio.h>
#include <string.h>
#include <sys/stat.h>
#include <unistd.h>

#include <atomic>
#include <mutex>
#include <string>

namespace {

constexpr int kProductInfoLid = 61;
constexpr int kDefaultRecordSize = 1024;
constexpr size_t kMaxFileBytes = 1 << 20;  // far above any record file we keep

struct PendingWrite {
    int fd = -1;
    std::string tempPath;
    std::string storePath;
    std::string original;  // content when opened: an unchanged copy is not renamed back
};

std::mutex gTableMutex;
PendingWrite gPending[16];

const char *file_name(int lid) { return lid == kProductInfoLid ? "PRODUCT_INFO" : nullptr; }

bool read_all(int fd, std::string *out) {
    out->clear();
    char buf[4096];
    for (;;) {
        ssize_t n = read(fd, buf, sizeof(buf));
        if (n < 0) {
            if (errno == EINTR) continue;
            return false;
        }
        if (n == 0) return true;
        out->append(buf, static_cast<size_t>(n));
        if (out->size() > kMaxFileBytes) {
            errno = EFBIG;
            return false;
        }
    }
}

bool write_all(int fd, const std::string &data) {
    size_t off = 0;
    while (off < data.size()) {
        ssize_t n = write(fd, data.data() + off, data.size() - off);
        if (n < 0) {
            if (errno == EINTR) continue;
            return false;
        }
        off += static_cast<size_t>(n);
    }
    return true;
}

// Record shape: "SIZE COUNT" from <store>.shape, else 1024-byte records filling the file.
void shape_of(const char *store, long long fileSize, int *size, int *count) {
    char path[PATH_MAX];
    char text[64];
    int s = 0, c = 0;
    if (snprintf(path, sizeof(path), "%s.shape", store) < static_cast<int>(sizeof(path)) &&
        tolk_read_file(path, text, sizeof(text)) > 0 && sscanf(text, "%d %d", &s, &c) == 2 && s > 0 && c >= 0) {
        *size = s;
        *count = c;
        return;
    }
    *size = kDefaultRecordSize;
    *count = static_cast<int>(fileSize / kDefaultRecordSize);
}

F_ID failed(int lid, bool isRead, int err) {
    F_ID id;
    id.iFileDesc = -1;
    id.ifile_lid = lid;
    id.bIsRead = isRead;
    errno = err;
    return id;
}

}  // namespace

extern "C" F_ID NVM_GetFileDesc(int file_lid, int *pRecSize, int *pRecNum, bool IsRead) {
    const char *name = file_name(file_lid);
    if (name == nullptr) return failed(file_lid, IsRead, ENOENT);
    char devicePath[64];
    snprintf(devicePath, sizeof(devicePath), "/nvram/%s", name);
    char store[PATH_MAX];
    if (tolk_device_path(devicePath, store, sizeof(store)) == nullptr) return failed(file_lid, IsRead, ENAMETOOLONG);

    int fd = openat(AT_FDCWD, store, O_RDONLY | O_CLOEXEC);
    if (fd < 0) return failed(file_lid, IsRead, errno);
    struct stat st;
    if (fstat(fd, &st) != 0) {
        int err = errno;
        close(fd);
        return failed(file_lid, IsRead, err);
    }
    if (!S_ISREG(st.st_mode)) {
        close(fd);
        return failed(file_lid, IsRead, S_ISDIR(st.st_mode) ? EISDIR : EINVAL);
    }
    int size = 0, count = 0;
    shape_of(store, static_cast<long long>(st.st_size), &size, &count);

    if (!IsRead) {
        // Copy the store into a hidden file beside it and hand out that copy.
        std::string content;
        bool ok = read_all(fd, &content);
        int err = errno;
        close(fd);
        if (!ok) return failed(file_lid, IsRead, err);
        static std::atomic<unsigned> counter{0};
        char temp[PATH_MAX];
        const char *slash = strrchr(store, '/');
        size_t dirlen = slash != nullptr ? static_cast<size_t>(slash - store + 1) : 0;
        int n = snprintf(temp, sizeof(temp), "%.*s.%s.w.%ld.%u", static_cast<int>(dirlen), store, store + dirlen,
                         static_cast<long>(getpid()), counter.fetch_add(1));
        if (n < 0 || static_cast<size_t>(n) >= sizeof(temp)) return failed(file_lid, IsRead, ENAMETOOLONG);
        fd = openat(AT_FDCWD, temp, O_RDWR | O_CREAT | O_EXCL | O_CLOEXEC, 0644);
        if (fd < 0) return failed(file_lid, IsRead, errno);
        if (!write_all(fd, content) || lseek(fd, 0, SEEK_SET) != 0) {
            err = errno;
            close(fd);
            unlink(temp);
            return failed(file_lid, IsRead, err);
        }
        std::lock_guard<std::mutex> lock(gTableMutex);
        PendingWrite *slot = nullptr;
        for (auto &p : gPending)
            if (p.fd < 0) {
                slot = &p;
                break;
            }
        if (slot == nullptr) {
            close(fd);
            unlink(temp);
            return failed(file_lid, IsRead, EMFILE);
        }
        slot->fd = fd;
        slot->tempPath = temp;
        slot->storePath = store;
        slot->original = std::move(content);
    }

    if (pRecSize != nullptr) *pRecSize = size;
    if (pRecNum != nullptr) *pRecNum = count;
    F_ID id;
    id.iFileDesc = fd;
    id.ifile_lid = file_lid;
    id.bIsRead = IsRead;
    return id;
}

extern "C" bool NVM_CloseFileDesc(F_ID FileID) {
    if (FileID.iFileDesc < 0) return false;
    PendingWrite pending;
    bool found = false;
    {
        std::lock_guard<std::mutex> lock(gTableMutex);
        for (auto &p : gPending)
            if (p.fd == FileID.iFileDesc) {
                pending = std::move(p);
                p = PendingWrite();
                found = true;
                break;
            }
    }
    if (!found) return close(FileID.iFileDesc) == 0;

    std::string now;
    bool readOk = lseek(pending.fd, 0, SEEK_SET) == 0 && read_all(pending.fd, &now);
    bool closed = close(pending.fd) == 0;
    if (!readOk || !closed) {
        unlink(pending.tempPath.c_str());
        return false;
    }
    // An access that only read leaves the store alone, so it cannot undo a write
    // that someone else made meanwhile.
    if (now == pending.original) {
        unlink(pending.tempPath.c_str());
        return true;
    }
    if (rename(pending.tempPath.c_str(), pending.storePath.c_str()) != 0) {
        int err = errno;
        unlink(pending.tempPath.c_str());
        errno = err;
        return false;
    }
    return true;
}
