#pragma once

#include <cstring>
#include <new>
#include <sqlite3.h>

namespace KivArchive {

/// SQLite's files, of which one access after the other can be made to fail. On one thread only.
class FaultyFiles {
public:
    struct Fault {
        /// Which access fails, counted from 1; none for 0.
        long number = 0;
        int code = SQLITE_IOERR;
        /// Whether later ones fail, too.
        bool staysSo = false;
        bool isOnlyWrites = false;
    };

    /// Makes these the files that SQLite uses, over those that it used.
    static void Install() {
        Own().plain = sqlite3_vfs_find(nullptr);
        Own().faulty = *Own().plain;
        Own().faulty.zName = "faulty";
        Own().faulty.szOsFile = static_cast<int>(sizeof(File)) + Own().plain->szOsFile;
        Own().faulty.xOpen = Open;
        Own().faulty.xDelete = Delete;
        sqlite3_vfs_register(&Own().faulty, 1);
    }

    static void Arm(Fault const& fault) {
        Own().fault = fault;
        Own().made = 0;
        Own().isArmed = true;
    }

    /// @return whether the access that was to fail has been made
    static bool Disarm() {
        Own().isArmed = false;
        return Own().made >= Own().fault.number;
    }

private:
    struct State {
        sqlite3_vfs* plain = nullptr;
        sqlite3_vfs faulty{};
        Fault fault;
        long made = 0;
        bool isArmed = false;
    };

    /// What SQLite opens: ours, and behind it the plain one.
    struct File {
        sqlite3_file base;
        sqlite3_file* Plain() noexcept { return reinterpret_cast<sqlite3_file*>(this + 1); }
    };

    static State& Own() {
        static State own;
        return own;
    }

    /// The failure of this access, if it is its turn.
    static int Meet(bool isWrite) {
        State& own = Own();
        if (!own.isArmed || (own.fault.isOnlyWrites && !isWrite))
            return SQLITE_OK;
        ++own.made;
        bool const fails = own.fault.staysSo ? own.made >= own.fault.number : own.made == own.fault.number;
        return fails ? own.fault.code : SQLITE_OK;
    }

    static sqlite3_file* Plain(sqlite3_file* file) { return reinterpret_cast<File*>(file)->Plain(); }

    static int Open(sqlite3_vfs* /*vfs*/, const char* name, sqlite3_file* file, int flags, int* outFlags) {
        file->pMethods = nullptr;
        if (Meet(false) != SQLITE_OK)
            return SQLITE_CANTOPEN;
        std::memset(Plain(file), 0, static_cast<std::size_t>(Own().plain->szOsFile));
        int const code = Own().plain->xOpen(Own().plain, name, Plain(file), flags, outFlags);
        if (code == SQLITE_OK)
            file->pMethods = &Methods();
        return code;
    }
    static int Delete(sqlite3_vfs* /*vfs*/, const char* name, int sync) {
        if (int const code = Meet(false); code != SQLITE_OK)
            return SQLITE_IOERR_DELETE;
        return Own().plain->xDelete(Own().plain, name, sync);
    }
    static int Close(sqlite3_file* file) { return Plain(file)->pMethods->xClose(Plain(file)); }
    static int Read(sqlite3_file* file, void* to, int size, sqlite3_int64 offset) {
        if (int const code = Meet(false); code != SQLITE_OK)
            return SQLITE_IOERR_READ;
        return Plain(file)->pMethods->xRead(Plain(file), to, size, offset);
    }
    static int Write(sqlite3_file* file, const void* from, int size, sqlite3_int64 offset) {
        if (int const code = Meet(true); code != SQLITE_OK)
            return code == SQLITE_FULL ? code : SQLITE_IOERR_WRITE;
        return Plain(file)->pMethods->xWrite(Plain(file), from, size, offset);
    }
    static int Truncate(sqlite3_file* file, sqlite3_int64 size) {
        if (int const code = Meet(true); code != SQLITE_OK)
            return SQLITE_IOERR_TRUNCATE;
        return Plain(file)->pMethods->xTruncate(Plain(file), size);
    }
    static int Sync(sqlite3_file* file, int flags) {
        if (int const code = Meet(true); code != SQLITE_OK)
            return code == SQLITE_FULL ? code : SQLITE_IOERR_FSYNC;
        return Plain(file)->pMethods->xSync(Plain(file), flags);
    }
    static int FileSize(sqlite3_file* file, sqlite3_int64* size) {
        if (int const code = Meet(false); code != SQLITE_OK)
            return SQLITE_IOERR_FSTAT;
        return Plain(file)->pMethods->xFileSize(Plain(file), size);
    }
    static int Lock(sqlite3_file* file, int kind) { return Plain(file)->pMethods->xLock(Plain(file), kind); }
    static int Unlock(sqlite3_file* file, int kind) { return Plain(file)->pMethods->xUnlock(Plain(file), kind); }
    static int CheckLock(sqlite3_file* file, int* held) {
        return Plain(file)->pMethods->xCheckReservedLock(Plain(file), held);
    }
    static int Control(sqlite3_file* file, int operation, void* argument) {
        return Plain(file)->pMethods->xFileControl(Plain(file), operation, argument);
    }
    static int SectorSize(sqlite3_file* file) { return Plain(file)->pMethods->xSectorSize(Plain(file)); }
    static int Traits(sqlite3_file* file) { return Plain(file)->pMethods->xDeviceCharacteristics(Plain(file)); }
    static int MapShared(sqlite3_file* file, int page, int size, int extend, void volatile** memory) {
        if (int const code = Meet(true); code != SQLITE_OK)
            return SQLITE_IOERR_SHMMAP;
        return Plain(file)->pMethods->xShmMap(Plain(file), page, size, extend, memory);
    }
    static int LockShared(sqlite3_file* file, int offset, int count, int flags) {
        return Plain(file)->pMethods->xShmLock(Plain(file), offset, count, flags);
    }
    static void Barrier(sqlite3_file* file) { Plain(file)->pMethods->xShmBarrier(Plain(file)); }
    static int UnmapShared(sqlite3_file* file, int remove) {
        return Plain(file)->pMethods->xShmUnmap(Plain(file), remove);
    }

    static sqlite3_io_methods const& Methods() {
        static sqlite3_io_methods const methods = [] {
            sqlite3_io_methods made{};
            made.iVersion = 2;
            made.xClose = Close;
            made.xRead = Read;
            made.xWrite = Write;
            made.xTruncate = Truncate;
            made.xSync = Sync;
            made.xFileSize = FileSize;
            made.xLock = Lock;
            made.xUnlock = Unlock;
            made.xCheckReservedLock = CheckLock;
            made.xFileControl = Control;
            made.xSectorSize = SectorSize;
            made.xDeviceCharacteristics = Traits;
            made.xShmMap = MapShared;
            made.xShmLock = LockShared;
            made.xShmBarrier = Barrier;
            made.xShmUnmap = UnmapShared;
            return made;
        }();
        return methods;
    }
};

} // namespace KivArchive
