// Frame transfer shared by the two ends: one sendmsg per frame, and staged
// receives that take in whatever has arrived with one recv.

#include <sys/uio.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <new>

#include "comm_internal.h"

namespace vokcomm {

FrameSend sendFrame(int fd, const FrameHeader& header, const void* payload, size_t length,
                    int flags, CallReport report) {
    iovec parts[2] = {{const_cast<FrameHeader*>(&header), sizeof(header)},
                      {const_cast<void*>(payload), length}};
    msghdr message = {};
    message.msg_iov = parts;
    message.msg_iovlen = length > 0 ? 2 : 1;
    FrameSend result;
    const size_t total = sizeof(header) + length;
    while (result.sent < total) {
        ssize_t n;
        do {
            n = sendmsg(fd, &message, flags);
        } while (n < 0 && errno == EINTR);
        const int error = errno;
        report(n);
        if (n < 1) {
            result.failed = n;
            result.error = error;
            return result;
        }
        result.sent += static_cast<size_t>(n);
        // Past what left: whole parts first, then into the part cut short.
        size_t done = static_cast<size_t>(n);
        while (done > 0 && done >= message.msg_iov->iov_len) {
            done -= message.msg_iov->iov_len;
            ++message.msg_iov;
            --message.msg_iovlen;
        }
        if (done > 0) {
            message.msg_iov->iov_base = static_cast<uint8_t*>(message.msg_iov->iov_base) + done;
            message.msg_iov->iov_len -= done;
        }
    }
    return result;
}

namespace {
void* (*const volatile wipeWith)(void*, int, size_t) = std::memset;
}

void ReceiveStage::discard() {
    if (bytes_ && end_ > 0) wipeWith(bytes_.get(), 0, end_);
    begin_ = end_ = 0;
}

ssize_t ReceiveStage::read(int fd, void* buffer, size_t length, CallReport report) {
    if (!bytes_ && capacity_ > 0) {
        bytes_.reset(new (std::nothrow) uint8_t[capacity_]);
        if (!bytes_) capacity_ = 0;
    }
    uint8_t* out = static_cast<uint8_t*>(buffer);
    for (;;) {
        const size_t take = std::min(length, staged());
        if (take > 0) std::memcpy(out, bytes_.get() + begin_, take);
        begin_ += take;
        out += take;
        length -= take;
        if (begin_ == end_) discard();
        if (length == 0) return 1;
        // The stage is empty here.
        const bool staging = length < capacity_;
        const ssize_t n = recvRetrying(fd, staging ? bytes_.get() : out,
                                       staging ? capacity_ : length, 0);
        report(n);
        if (n < 1) return n;
        if (staging) {
            end_ = static_cast<size_t>(n);
        } else {
            out += n;
            length -= static_cast<size_t>(n);
        }
    }
}

}  // namespace vokcomm
