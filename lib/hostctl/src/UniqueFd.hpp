// A file descriptor closed when its owner goes out of scope.
#pragma once

#include <unistd.h>

namespace HostCtl::Lib {

class UniqueFd {
public:
    explicit UniqueFd(int fd) : _fd(fd) {}
    ~UniqueFd() {
        if (_fd >= 0) close(_fd);
    }
    UniqueFd(const UniqueFd&) = delete;
    UniqueFd& operator=(const UniqueFd&) = delete;
    int Get() const { return _fd; }
    // Hands the descriptor over (to be closed by the caller, who may want to
    // see close's result).
    int Release() {
        const int fd = _fd;
        _fd = -1;
        return fd;
    }

private:
    int _fd;
};

}  // namespace HostCtl::Lib
