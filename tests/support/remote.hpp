// Test helpers for the radio receiver: a FIFO standing in for its hiddev
// device, and the remote-sim tool that writes key reports into it.
#pragma once

#include <sys/types.h>

#include <string>
#include <vector>

namespace vt {

// Makes a FIFO at path (default: the receiver's "/dev/usb/hiddev5") and holds
// a writer open on it for its whole life, so that the daemon's read-only open
// does not wait and its reads never see end of file between scripts.
class ReceiverFifo {
public:
    explicit ReceiverFifo(const std::string& path = "/dev/usb/hiddev5");
    ~ReceiverFifo();
    ReceiverFifo(const ReceiverFifo&) = delete;
    ReceiverFifo& operator=(const ReceiverFifo&) = delete;

    int WriterFd() const { return writer_; }
    // Writes bytes in one piece; false if not all of them went in.
    bool Write(const void* bytes, size_t size) const;

private:
    std::string path_;
    int writer_ = -1;
};

// Runs remote-sim with the script words (for example {"tap", "Play"}) and
// returns its exit code (-1 if it did not end within timeoutMs); its output in *out.
int RemoteSim(const std::vector<std::string>& script, std::string* out = nullptr,
              int timeoutMs = 30000);

// Whether process pid holds a descriptor open on path.
bool HoldsOpen(pid_t pid, const std::string& path);

}  // namespace vt
