// SQLite's layer to the operating system's files, on which writing can be made to fail. One at a time; it outlives the
// connections that use it.
#pragma once

#include <atomic>
#include <new>
#include <sqlite3.h>
#include <string>

namespace vela::platform {

class FailingVfs {
public:
    static constexpr const char* kName = "failing";

    FailingVfs() {
        writeError = SQLITE_OK;
        sqlite3_vfs* const usual = sqlite3_vfs_find(nullptr);
        vfs_ = *usual;
        vfs_.pNext = nullptr;
        vfs_.zName = kName;
        vfs_.szOsFile = static_cast<int>(sizeof(File)) + usual->szOsFile;
        vfs_.pAppData = usual;
        vfs_.xOpen = openFile;
        sqlite3_vfs_register(&vfs_, 0);
    }
    ~FailingVfs() { sqlite3_vfs_unregister(&vfs_); }
    FailingVfs(const FailingVfs&) = delete;
    FailingVfs& operator=(const FailingVfs&) = delete;

    /// Every write and flush answers this code (SQLITE_FULL, SQLITE_IOERR_WRITE) until it is SQLITE_OK again.
    void fail(int code) { writeError = code; }
    /// How often a file was made durable since the process began.
    static int syncsSoFar() { return syncs; }

private:
    struct File {
        sqlite3_file base;
        sqlite3_file* real() { return reinterpret_cast<sqlite3_file*>(this + 1); }
    };

    static inline std::atomic<int> writeError{SQLITE_OK};
    static inline std::atomic<int> syncs{0};

    static sqlite3_file* real(sqlite3_file* file) { return reinterpret_cast<File*>(file)->real(); }
    static const sqlite3_io_methods* of(sqlite3_file* file) { return real(file)->pMethods; }

    static int openFile(sqlite3_vfs* vfs, const char* name, sqlite3_file* file, int flags, int* opened) {
        auto* const usual = static_cast<sqlite3_vfs*>(vfs->pAppData);
        new (file) File{};
        const int code = usual->xOpen(usual, name, real(file), flags, opened);
        file->pMethods = real(file)->pMethods == nullptr ? nullptr : &kMethods;
        return code;
    }

    // clang-format off
    static inline const sqlite3_io_methods kMethods{
        3,
        [](sqlite3_file* f) { return of(f)->xClose(real(f)); },
        [](sqlite3_file* f, void* to, int bytes, sqlite3_int64 at) { return of(f)->xRead(real(f), to, bytes, at); },
        [](sqlite3_file* f, const void* from, int bytes, sqlite3_int64 at) {
            return writeError != SQLITE_OK ? writeError.load() : of(f)->xWrite(real(f), from, bytes, at);
        },
        [](sqlite3_file* f, sqlite3_int64 size) { return of(f)->xTruncate(real(f), size); },
        [](sqlite3_file* f, int flags) {
            ++syncs;
            return writeError != SQLITE_OK ? SQLITE_IOERR_FSYNC : of(f)->xSync(real(f), flags);
        },
        [](sqlite3_file* f, sqlite3_int64* size) { return of(f)->xFileSize(real(f), size); },
        [](sqlite3_file* f, int kind) { return of(f)->xLock(real(f), kind); },
        [](sqlite3_file* f, int kind) { return of(f)->xUnlock(real(f), kind); },
        [](sqlite3_file* f, int* held) { return of(f)->xCheckReservedLock(real(f), held); },
        [](sqlite3_file* f, int what, void* argument) { return of(f)->xFileControl(real(f), what, argument); },
        [](sqlite3_file* f) { return of(f)->xSectorSize(real(f)); },
        [](sqlite3_file* f) { return of(f)->xDeviceCharacteristics(real(f)); },
        [](sqlite3_file* f, int page, int bytes, int extends, void volatile** memory) {
            return of(f)->xShmMap(real(f), page, bytes, extends, memory);
        },
        [](sqlite3_file* f, int at, int count, int flags) { return of(f)->xShmLock(real(f), at, count, flags); },
        [](sqlite3_file* f) { of(f)->xShmBarrier(real(f)); },
        [](sqlite3_file* f, int removes) { return of(f)->xShmUnmap(real(f), removes); },
        [](sqlite3_file* f, sqlite3_int64 at, int bytes, void** memory) {
            return of(f)->xFetch(real(f), at, bytes, memory);
        },
        [](sqlite3_file* f, sqlite3_int64 at, void* memory) { return of(f)->xUnfetch(real(f), at, memory); },
    };
    // clang-format on

    sqlite3_vfs vfs_{};
};

} // namespace vela::platform
