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

    /// Hands a call on to the plain file.
    template <auto Method, class Result, class... Arguments>
    static Result HandOn(sqlite3_file* file, Arguments... arguments) {
        return (Plain(file)->pMethods->*Method)(Plain(file), arguments...);
    }

    /// Hands a call on unless it is its turn to fail, with @p failure, or with @p full where the disk is full.
    template <auto Method, bool isWrite, int failure, int full = failure, class... Arguments>
    static int Try(sqlite3_file* file, Arguments... arguments) {
        if (int const code = Meet(isWrite); code != SQLITE_OK)
            return code == SQLITE_FULL ? full : failure;
        return HandOn<Method, int>(file, arguments...);
    }

    static sqlite3_io_methods const& Methods() {
        using IoMethods = sqlite3_io_methods;
        static IoMethods const methods = [] {
            IoMethods made{};
            made.iVersion = 2;
            made.xClose = HandOn<&IoMethods::xClose>;
            made.xRead = Try<&IoMethods::xRead, false, SQLITE_IOERR_READ>;
            made.xWrite = Try<&IoMethods::xWrite, true, SQLITE_IOERR_WRITE, SQLITE_FULL>;
            made.xTruncate = Try<&IoMethods::xTruncate, true, SQLITE_IOERR_TRUNCATE>;
            made.xSync = Try<&IoMethods::xSync, true, SQLITE_IOERR_FSYNC, SQLITE_FULL>;
            made.xFileSize = Try<&IoMethods::xFileSize, false, SQLITE_IOERR_FSTAT>;
            made.xLock = HandOn<&IoMethods::xLock>;
            made.xUnlock = HandOn<&IoMethods::xUnlock>;
            made.xCheckReservedLock = HandOn<&IoMethods::xCheckReservedLock>;
            made.xFileControl = HandOn<&IoMethods::xFileControl>;
            made.xSectorSize = HandOn<&IoMethods::xSectorSize>;
            made.xDeviceCharacteristics = HandOn<&IoMethods::xDeviceCharacteristics>;
            made.xShmMap = Try<&IoMethods::xShmMap, true, SQLITE_IOERR_SHMMAP>;
            made.xShmLock = HandOn<&IoMethods::xShmLock>;
            made.xShmBarrier = HandOn<&IoMethods::xShmBarrier>;
            made.xShmUnmap = HandOn<&IoMethods::xShmUnmap>;
            return made;
        }();
        return methods;
    }
};

} // namespace KivArchive
