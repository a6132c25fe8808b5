#pragma once

#include <cstring>
#include <new>
#include <sqlite3.h>

namespace KivArchive {

/// SQLite's files, with one access after the other made to fail. On one thread only.
class FaultyFiles {
public:
    struct Fault {
        /// The number of the access that fails, from 1 on; 0 for none.
        long number = 0;
        int code = SQLITE_IOERR;
        /// Whether all later accesses fail, too.
        bool staysSo = false;
        bool isOnlyWrites = false;
    };

    /// Lets SQLite use these files, which pass calls on to those that it used before.
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

    /// @return whether an access has failed
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

    /// What SQLite opens: this file, followed by the plain one.
    struct File {
        sqlite3_file base;
        sqlite3_file* Plain() noexcept { return reinterpret_cast<sqlite3_file*>(this + 1); }
    };

    static State& Own() {
        static State own;
        return own;
    }

    /// Counts an access. @return its failure, if it is the one to fail
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

    /// Passes a call on to the plain file.
    template <auto Method, class Result, class... Arguments>
    static Result PassOn(sqlite3_file* file, Arguments... arguments) {
        return (Plain(file)->pMethods->*Method)(Plain(file), arguments...);
    }

    /// Passes a call on, unless it is the one to fail: with @p failure, or with @p full where the disk is full.
    template <auto Method, bool isWrite, int failure, int full = failure, class... Arguments>
    static int Try(sqlite3_file* file, Arguments... arguments) {
        if (int const code = Meet(isWrite); code != SQLITE_OK)
            return code == SQLITE_FULL ? full : failure;
        return PassOn<Method, int>(file, arguments...);
    }

    static sqlite3_io_methods const& Methods() {
        using IoMethods = sqlite3_io_methods;
        static IoMethods const methods = [] {
            IoMethods made{};
            made.iVersion = 2;
            made.xClose = PassOn<&IoMethods::xClose>;
            made.xRead = Try<&IoMethods::xRead, false, SQLITE_IOERR_READ>;
            made.xWrite = Try<&IoMethods::xWrite, true, SQLITE_IOERR_WRITE, SQLITE_FULL>;
            made.xTruncate = Try<&IoMethods::xTruncate, true, SQLITE_IOERR_TRUNCATE>;
            made.xSync = Try<&IoMethods::xSync, true, SQLITE_IOERR_FSYNC, SQLITE_FULL>;
            made.xFileSize = Try<&IoMethods::xFileSize, false, SQLITE_IOERR_FSTAT>;
            made.xLock = PassOn<&IoMethods::xLock>;
            made.xUnlock = PassOn<&IoMethods::xUnlock>;
            made.xCheckReservedLock = PassOn<&IoMethods::xCheckReservedLock>;
            made.xFileControl = PassOn<&IoMethods::xFileControl>;
            made.xSectorSize = PassOn<&IoMethods::xSectorSize>;
            made.xDeviceCharacteristics = PassOn<&IoMethods::xDeviceCharacteristics>;
            made.xShmMap = Try<&IoMethods::xShmMap, true, SQLITE_IOERR_SHMMAP>;
            made.xShmLock = PassOn<&IoMethods::xShmLock>;
            made.xShmBarrier = PassOn<&IoMethods::xShmBarrier>;
            made.xShmUnmap = PassOn<&IoMethods::xShmUnmap>;
            return made;
        }();
        return methods;
    }
};

} // namespace KivArchive
