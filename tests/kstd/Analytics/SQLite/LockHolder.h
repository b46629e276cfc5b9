#pragma once

#include "base/FileDescriptor.h"
#include "base/NotCopied.h"

#include <gtest/gtest.h>

#include <sqlite3.h>
#include <string>
#include <sys/wait.h>
#include <unistd.h>

namespace kstd {

/// Another process that holds a database when it is told to. It must be made before this process
/// opens a database: SQLite does not work on across a fork.
class LockHolder : private base::NotCopied {
  public:
    explicit LockHolder(const std::string& path) {
        int toChild[2] = {-1, -1};
        int fromChild[2] = {-1, -1};
        EXPECT_EQ(::pipe(toChild), 0);
        EXPECT_EQ(::pipe(fromChild), 0);
        child_ = ::fork();
        if (child_ == 0) {
            ::close(toChild[1]);
            obey(path, toChild[0], fromChild[1]);
        }
        ::close(toChild[0]);
        ::close(fromChild[1]);
        orders_ = base::FileDescriptor(toChild[1]);
        answers_ = base::FileDescriptor(fromChild[0]);
    }
    ~LockHolder() {
        orders_.reset();
        int status = -1;
        ::waitpid(child_, &status, 0);
        EXPECT_EQ(status, 0);
    }

    void lock() { order('l'); }
    void unlock() { order('u'); }

  private:
    void order(char what) {
        EXPECT_EQ(::write(orders_.get(), &what, 1), 1);
        char answer = 0;
        EXPECT_EQ(::read(answers_.get(), &answer, 1), 1);
        EXPECT_EQ(answer, what);
    }

    [[noreturn]] static void obey(const std::string& path, int orders, int answers) {
        sqlite3* db = nullptr;
        char what = 0;
        bool fine = true;
        while (fine && ::read(orders, &what, 1) == 1) {
            if (db == nullptr) {
                fine = sqlite3_open(path.c_str(), &db) == SQLITE_OK;
            }
            fine = fine && sqlite3_exec(db, what == 'l' ? "begin exclusive" : "end", nullptr,
                                        nullptr, nullptr) == SQLITE_OK;
            fine = fine && ::write(answers, &what, 1) == 1;
        }
        fine = fine && sqlite3_close(db) == SQLITE_OK;
        ::_exit(fine ? 0 : 1);
    }

    pid_t child_ = -1;
    base::FileDescriptor orders_;
    base::FileDescriptor answers_;
};

} // namespace kstd
