#pragma once
// The two dialog programs: how each is asked, and what its end says. All pure, but for finding them.

#include <optional>
#include <string>
#include <vector>

#include "platform/UserAlert.h"

namespace lumacast {

/// Which owners a program may have.
enum class ProgramOwner { Administrator, Anybody };

struct DialogProgram {
    enum class Kind { Yad, Zenity };
    Kind kind;
    std::string path;  ///< absolute
};

/// The one of the directories' programs that is asked: yad before zenity, wherever they are. With
/// ProgramOwner::Administrator only one that nobody else can have put or written there. Blocks as long as the disk
/// does.
std::optional<DialogProgram> findDialogProgram(const std::vector<std::string>& directories, ProgramOwner owner);

/// What a dialog shows: every text plain and of a limited length.
struct DialogTexts {
    std::string header, message, application;
    std::string defaultButton;
    std::optional<std::string> alternateButton;
    std::string otherButton;
    std::string icon;  ///< a name of the icon theme, or an absolute path
};

/// None for a question that can't be asked so that only one button says each answer: one without the other button, with
/// a button without a text, or with two buttons of one text.
std::optional<DialogTexts> dialogTexts(const AlertContent& content, const std::optional<std::string>& icon);

/// The program's arguments, its name first. From the left: the other button, which has the focus at first, the
/// alternate and the default button. `styleDirectory` holds what writeDialogStyle has put there.
std::vector<std::string> dialogArguments(const DialogProgram& program, const DialogTexts& texts,
                                         const std::string& styleDirectory);

/// Makes `directory` and in it the style that keeps the Return key from pressing a button, whichever has the focus (the
/// space bar still does). False when it can't be had. Blocks as long as the disk does.
[[nodiscard]] bool writeDialogStyle(const std::string& directory);

/// How a dialog program ended.
struct DialogEnd {
    std::optional<int> exitStatus;  ///< none when a signal ended it
    std::string output;
};

/// The button that was pressed. Only what the press of a granting button alone gives is one; everything else is the
/// other button.
UserAlert::Response responseOf(const DialogProgram& program, const DialogTexts& texts, const DialogEnd& end);

/// What the dialog's window says of itself (the class of WM_CLASS), whichever program shows it.
inline constexpr const char* kDialogWindowClass = "lumacast-alert";

}  // namespace lumacast
