#pragma once

#include <cstddef>
#include <map>
#include <string>

/// A naive index of one folder, kept up to date from nothing but its queue: one entry per object,
/// with the content of each file as it was when the entry was last settled. Lines are taken in
/// their order; what they ask to look at is looked at when all are read, at the place to which
/// later lines have moved it. So it shows whether the lines themselves are complete and in order.
class ShareModel {
  public:
    using Entries = std::map<std::string, std::string>;

    ShareModel(std::string folder, std::string queue);

    /// Takes the queue away under its lock, and carries it out.
    void Pass();

    /// What is on the disk now, without hidden names.
    Entries OnDisk() const;

    /// Whether the passes make the model and the disk equal in time. Prints what differs if not.
    bool Converges();

    /// Crash markers seen so far.
    std::size_t CrashCount() const { return crashes_; }

  private:
    void Carry(const std::string& line);
    void Mark(const std::string& path) { marked_[path]; }
    static void DropBelow(Entries& entries, const std::string& path);
    static bool MoveBelow(Entries& entries, const std::string& from, const std::string& to);
    void Walk(const std::string& path, Entries& found) const;
    void PrintDifference() const;

    std::string folder_;
    std::string queue_;
    Entries entries_;
    Entries marked_;  ///< paths to look at, with everything below them
    /// Looked at and not found. When a line of a later pass moves what is above, this is why: as
    /// every consumer must, the model checks the moved directory then.
    Entries missed_;
    std::size_t crashes_ = 0;
    std::string consumed_;  ///< lines since the model last equalled the disk
};
