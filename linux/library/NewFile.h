#pragma once
#include <string>
#include <string_view>
#include <variant>

#include "linux/ipc/Fd.h"

namespace lumacast {

/// How a file is kept from sight until it is whole.
enum class Unseen {
    WithoutName,  ///< O_TMPFILE; where the file system can't, as below
    HiddenName,
};

/// A file that is not seen in its folder until it is whole. Destroyed before it was given its name, it is gone. Of one
/// thread at a time; blocks as long as the disk does.
class NewFile final {
public:
    /// Makes an empty file in an open folder, which must outlive it; or the error number. Readable and writable for its
    /// owner, for others readable as the process's umask says.
    static std::variant<NewFile, int> in(int folder, Unseen unseen);
    NewFile(NewFile&& other) noexcept;
    NewFile& operator=(NewFile&&) = delete;
    ~NewFile();

    int get() const { return file_.get(); }

    /// Gives it a name in its folder. EEXIST when the name is taken (nothing is ever replaced), else the error number;
    /// it can then be given another one. 0 when it has its name: it then stays.
    [[nodiscard]] int giveName(const std::string& name);

private:
    NewFile(int folder, Fd file, std::string hiddenName);
    int giveNameToUnnamed(const std::string& name);
    int giveNameToHidden(const std::string& name);

    int folder_;
    Fd file_;
    std::string hiddenName_;  ///< empty for none
};

/// Whether a file has the name of a hidden one: of a save that goes on, or that a process could not end.
bool isHiddenName(std::string_view name);

}  // namespace lumacast
