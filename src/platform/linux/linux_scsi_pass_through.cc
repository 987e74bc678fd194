#include "platform/linux/linux_scsi_pass_through.h"

#include <fcntl.h>
#include <scsi/sg.h>
#include <sys/ioctl.h>
#include <unistd.h>

#include <algorithm>
#include <system_error>
#include <utility>
#include <vector>

namespace zt::platform {
namespace {

namespace fs = std::filesystem;

// SG_IO takes one buffer; more entries would need an iovec table, which no caller uses.
constexpr std::size_t kMaxEntries = 1;
// driver_status: sense data were returned with the command, which is not a transport failure.
constexpr unsigned kDriverSense = 0x08;
constexpr unsigned kDriverStatusMask = 0x0f;

class FileDescriptor {
 public:
  FileDescriptor() = default;
  explicit FileDescriptor(int fd) : fd_(fd) {}
  FileDescriptor(FileDescriptor&& other) noexcept : fd_(std::exchange(other.fd_, -1)) {}
  FileDescriptor& operator=(FileDescriptor&& other) noexcept {
    if (this != &other) {
      reset();
      fd_ = std::exchange(other.fd_, -1);
    }
    return *this;
  }
  ~FileDescriptor() { reset(); }

  int get() const { return fd_; }
  explicit operator bool() const { return fd_ >= 0; }
  void reset() {
    if (fd_ >= 0) ::close(std::exchange(fd_, -1));
  }

 private:
  int fd_ = -1;
};

class LinuxScsiTask final : public ScsiTask {
 public:
  explicit LinuxScsiTask(int fd) : fd_(fd) {}

  bool setCommandDescriptorBlock(std::span<const std::uint8_t> cdb) override {
    if (cdb.empty() || cdb.size() > 16) return false;
    cdb_.assign(cdb.begin(), cdb.end());
    return true;
  }

  bool setScatterGatherEntries(std::span<const ScatterGatherEntry> entries,
                               std::uint64_t transferCount, TransferDirection direction) override {
    if (entries.size() > kMaxEntries) return false;
    std::uint64_t room = entries.empty() ? 0 : entries.front().size();
    if (transferCount > room || transferCount > 0xffffffffU) return false;
    if ((direction == TransferDirection::None) != (transferCount == 0)) return false;
    buffer_ = entries.empty() ? ScatterGatherEntry() : entries.front().first(transferCount);
    direction_ = direction;
    return true;
  }

  bool setTimeoutDuration(std::chrono::milliseconds timeout) override {
    if (timeout.count() <= 0 || timeout.count() > 0xffffffffLL) return false;
    timeout_ = timeout;
    return true;
  }

  std::optional<ScsiTaskOutcome> executeTaskSync() override {
    if (cdb_.empty()) return std::nullopt;
    ScsiTaskOutcome outcome;
    sg_io_hdr_t header{};
    header.interface_id = 'S';
    header.cmdp = cdb_.data();
    header.cmd_len = static_cast<unsigned char>(cdb_.size());
    header.dxferp = buffer_.data();
    header.dxfer_len = static_cast<unsigned>(buffer_.size());
    switch (direction_) {
      case TransferDirection::None:
        header.dxfer_direction = SG_DXFER_NONE;
        break;
      case TransferDirection::FromDevice:
        header.dxfer_direction = SG_DXFER_FROM_DEV;
        break;
      case TransferDirection::ToDevice:
        header.dxfer_direction = SG_DXFER_TO_DEV;
        break;
    }
    header.sbp = outcome.senseData.data();
    header.mx_sb_len = static_cast<unsigned char>(outcome.senseData.size());
    header.timeout = static_cast<unsigned>(timeout_.count());
    // ENOTTY for a node that is not a SCSI device (a regular file, /dev/null...).
    if (::ioctl(fd_, SG_IO, &header) < 0) return std::nullopt;
    // Host or driver errors mean the command did not come back from the device; a SCSI status
    // with sense data is the device's own answer and is left to the caller.
    if (header.host_status != 0 || (header.driver_status & kDriverStatusMask & ~kDriverSense)) {
      return std::nullopt;
    }
    outcome.taskStatus = header.status;
    outcome.senseLength = header.sb_len_wr;
    outcome.bytesTransferred = buffer_.size() - static_cast<std::size_t>(std::max(header.resid, 0));
    return outcome;
  }

 private:
  int fd_;
  std::vector<std::uint8_t> cdb_;
  ScatterGatherEntry buffer_;
  TransferDirection direction_ = TransferDirection::None;
  // The kernel's default when none is set.
  std::chrono::milliseconds timeout_{60000};
};

class LinuxScsiTaskDevice final : public ScsiTaskDevice {
 public:
  LinuxScsiTaskDevice(ScsiNodes nodes, FileDescriptor disk)
      : nodes_(std::move(nodes)), disk_(std::move(disk)) {}
  ~LinuxScsiTaskDevice() override { releaseExclusiveAccess(); }

  bool obtainExclusiveAccess() override {
    if (exclusive_) return true;
    if (!nodes_.generic) {
      // Without a scsi-generic node there is nothing to hold; the device library's lock
      // still keeps other syncs away.
      exclusive_ = true;
      return true;
    }
    // O_EXCL on a scsi-generic node refuses while another program has it open; O_NONBLOCK
    // makes that refusal immediate instead of a wait.
    FileDescriptor generic(
        ::open(nodes_.generic->c_str(), O_RDWR | O_EXCL | O_NONBLOCK | O_CLOEXEC));
    if (!generic) return false;
    generic_ = std::move(generic);
    exclusive_ = true;
    return true;
  }

  void releaseExclusiveAccess() override {
    generic_.reset();
    exclusive_ = false;
  }

  std::unique_ptr<ScsiTask> createTask() override {
    if (generic_) return std::make_unique<LinuxScsiTask>(generic_.get());
    if (disk_) return std::make_unique<LinuxScsiTask>(disk_.get());
    return nullptr;
  }

 private:
  ScsiNodes nodes_;
  FileDescriptor disk_;
  FileDescriptor generic_;
  bool exclusive_ = false;
};

class LinuxScsiPlugIn final : public ScsiPlugIn {
 public:
  explicit LinuxScsiPlugIn(ScsiNodes nodes) : nodes_(std::move(nodes)) {}

  std::unique_ptr<ScsiTaskDevice> scsiTaskDevice() override {
    return LinuxScsiPassThrough::openTaskDevice(nodes_);
  }

 private:
  ScsiNodes nodes_;
};

// The first (by name) entry of a sysfs folder that lists a device's nodes.
std::optional<std::string> firstChild(const fs::path& folder) {
  std::error_code error;
  std::vector<std::string> names;
  for (const auto& child : fs::directory_iterator(folder, error)) {
    names.push_back(child.path().filename().string());
  }
  if (error || names.empty()) return std::nullopt;
  return *std::min_element(names.begin(), names.end());
}

}  // namespace

LinuxScsiPassThrough::LinuxScsiPassThrough(fs::path devices) : devices_(std::move(devices)) {}

std::unique_ptr<ScsiPlugIn> LinuxScsiPassThrough::createPlugIn(const RegistryEntry& entry) {
  const fs::path folder = entry.path();
  ScsiNodes nodes;
  if (auto disk = firstChild(folder / "block")) nodes.disk = devices_ / *disk;
  if (auto generic = firstChild(folder / "scsi_generic")) nodes.generic = devices_ / *generic;
  if (!nodes.disk && !nodes.generic) return nullptr;
  return std::make_unique<LinuxScsiPlugIn>(std::move(nodes));
}

std::unique_ptr<ScsiTaskDevice> LinuxScsiPassThrough::openTaskDevice(const ScsiNodes& nodes) {
  if (!nodes.disk && !nodes.generic) return nullptr;
  FileDescriptor disk;
  if (nodes.disk) {
    // Read-only and without waiting for media: the commands only read, and a mounted disk
    // must not be disturbed.
    disk = FileDescriptor(::open(nodes.disk->c_str(), O_RDONLY | O_NONBLOCK | O_CLOEXEC));
    if (!disk) return nullptr;
  }
  return std::make_unique<LinuxScsiTaskDevice>(nodes, std::move(disk));
}

}  // namespace zt::platform
