#pragma once

#include <functional>
#include <random>
#include <string>
#include <vector>

/// Does random things to the files below a directory: creates, changes, deletes and renames files
/// and directories, replaces files by renaming, moves things out and in.
class FileUser {
  public:
    /// Told of each change with the EVENT_* bit, whether it is a directory, the path and, for a
    /// rename, the old path: what a monitor would see.
    using Observer = std::function<void(unsigned int event, bool is_dir, const std::string& path,
                                        const std::string& path_old)>;

    /// `outside` is an existing directory on the same file system.
    FileUser(unsigned int seed, std::string root, std::string outside, Observer observer);

    void DoSomething();

    /// A random number below the limit, from the same seed.
    std::size_t Below(std::size_t limit) { return random_() % limit; }

  private:
    void Report(unsigned int event, bool is_dir, const std::string& path,
                const std::string& path_old = "") const;
    std::vector<std::string> Existing(bool directories) const;
    std::string Pick(const std::vector<std::string>& from);
    std::string SomeFile() { return Pick(Existing(false)); }
    std::string SomeDirectory() { return Pick(Existing(true)); }
    std::string FreeName();
    void Write(const std::string& path);
    void DeleteTree(const std::string& path);

    void CreateFile();
    void CreateDirectory();
    void ModifyFile();
    void ChangeRights();
    void DeleteSomething();
    void Rename();
    void ReplaceByRename();
    void MoveOut();
    void MoveIn();

    std::mt19937 random_;
    const std::string root_;
    const std::string outside_;
    const Observer observer_;
    int counter_ = 0;
};
