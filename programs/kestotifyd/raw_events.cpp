#include "programs/kestotifyd/raw_events.h"

#include <fcntl.h>
#include <sys/fanotify.h>
#include <sys/inotify.h>

#include <cstddef>
#include <cstring>

namespace kestotifyd {
namespace {

/// A structure of the kernel's, copied: fanotify's follow each other at multiples of four bytes
/// only. `bytes` holds it whole.
template <typename T>
T Load(std::string_view bytes) {
    T value;
    std::memcpy(&value, bytes.data(), sizeof(value));
    return value;
}

std::string UpToNul(std::string_view bytes) {
    return std::string(bytes.substr(0, bytes.find('\0')));
}

/// Reads one information record: file system, handle and, for most types, a name behind that.
void ReadRecord(std::string_view record, std::uint8_t type, FanotifyEvent& event) {
    constexpr std::size_t kHandle = offsetof(fanotify_event_info_fid, handle);
    if (record.size() < kHandle + sizeof(file_handle)) {
        return;
    }
    const std::string_view bytes = record.substr(kHandle);
    const std::size_t size = sizeof(file_handle) + Load<file_handle>(bytes).handle_bytes;
    if (size > bytes.size()) {
        return;
    }
    const std::string handle(bytes.substr(0, size));
    const std::string name = UpToNul(bytes.substr(size));
    switch (type) {
        case FAN_EVENT_INFO_TYPE_FID:
            event.target = handle;
            break;
        case FAN_EVENT_INFO_TYPE_DFID_NAME:
            event.place = {handle, name};
            break;
        case FAN_EVENT_INFO_TYPE_OLD_DFID_NAME:
            event.old_place = {handle, name};
            break;
        case FAN_EVENT_INFO_TYPE_NEW_DFID_NAME:
            event.new_place = {handle, name};
            break;
        default:
            return;
    }
    event.file_system = record.substr(offsetof(fanotify_event_info_fid, fsid),
                                      sizeof(fanotify_event_info_fid::fsid));
}

}  // namespace

std::optional<InotifyEvent> TakeInotifyEvent(std::string_view& buffer) {
    if (buffer.size() < sizeof(inotify_event)) {
        return std::nullopt;
    }
    const auto header = Load<inotify_event>(buffer);
    buffer.remove_prefix(sizeof(inotify_event));
    if (header.len > buffer.size()) {
        buffer = {};
        return std::nullopt;
    }
    const std::string name = UpToNul(buffer.substr(0, header.len));
    buffer.remove_prefix(header.len);
    return InotifyEvent{header.wd, header.mask, header.cookie, name};
}

std::optional<FanotifyEvent> TakeFanotifyEvent(std::string_view& buffer) {
    if (buffer.size() < sizeof(fanotify_event_metadata)) {
        return std::nullopt;
    }
    const auto metadata = Load<fanotify_event_metadata>(buffer);
    if (metadata.event_len < sizeof(metadata) || metadata.event_len > buffer.size() ||
        metadata.metadata_len > metadata.event_len) {
        buffer = {};
        return std::nullopt;
    }
    FanotifyEvent event;
    event.mask = metadata.mask;
    event.pid = metadata.pid;
    // Both lengths are the kernel's: later versions have longer headers and more records.
    std::string_view records = buffer.substr(0, metadata.event_len);
    records.remove_prefix(metadata.metadata_len);
    while (records.size() >= sizeof(fanotify_event_info_header)) {
        const auto header = Load<fanotify_event_info_header>(records);
        if (header.len < sizeof(header) || header.len > records.size()) {
            break;
        }
        ReadRecord(records.substr(0, header.len), header.info_type, event);
        records.remove_prefix(header.len);
    }
    buffer.remove_prefix(metadata.event_len);
    return event;
}

}  // namespace kestotifyd
