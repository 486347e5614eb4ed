#include "linux/desktop/DialogProgram.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <string_view>

#include "linux/desktop/AlertText.h"
#include "linux/ipc/Fd.h"

namespace lumacast {
namespace {

constexpr std::size_t kLongestHeader = 160, kLongestMessage = 600, kLongestButton = 40, kLongestIdentifier = 80;
constexpr int kHeaderColumns = 44, kColumns = 60;
constexpr std::size_t kLongestIcon = 1024;
constexpr const char* kUnknownIcon = "dialog-question";
constexpr int kWidth = 560;

// Exit statuses of yad's buttons: none that it gives for anything else (0, 1, 70, 252 and 126, 127, 128 + a signal),
// and no two that differ in one bit.
constexpr int kDefaultStatus = 39, kAlternateStatus = 90, kOtherStatus = 92;

constexpr std::string_view kStyle =
    "@binding-set LumacastReturnPressesNothing { unbind \"Return\"; unbind \"KP_Enter\"; unbind \"ISO_Enter\"; }\n"
    "* { -gtk-key-bindings: LumacastReturnPressesNothing; }\n";

bool mayRun(const std::string& path, ProgramOwner owner) {
    struct stat status {};
    if (::stat(path.c_str(), &status) != 0 || !S_ISREG(status.st_mode) || ::access(path.c_str(), X_OK) != 0)
        return false;
    return owner == ProgramOwner::Anybody || (status.st_uid == 0 && (status.st_mode & (S_IWGRP | S_IWOTH)) == 0);
}

bool isIcon(std::string_view icon) {
    if (icon.empty() || icon.size() > kLongestIcon) return false;
    const bool isPath = icon.front() == '/';
    return std::all_of(icon.begin(), icon.end(), [&](char c) {
        return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9') || c == '.' || c == '-' ||
               c == '_' || c == '+' || (isPath && (static_cast<unsigned char>(c) > 0x20 && c != 0x7F)) ||
               (isPath && c == ' ');
    });
}

/// A name of the icon theme has no ending, but is often written with one.
std::string iconNamed(std::string icon) {
    if (icon.front() != '/')
        for (const std::string_view ending : {".png", ".svg", ".xpm"})
            if (icon.size() > ending.size() && icon.ends_with(ending)) icon.resize(icon.size() - ending.size());
    return icon;
}

/// A press of Alt with a letter of the label must press nothing: no underlined letters.
std::string withoutMnemonic(std::string_view label) {
    std::string doubled;
    for (const char c : label) doubled.append(c == '_' ? 2 : 1, c);
    return doubled;
}

/// In yad a label is markup, "!" begins an icon's name, and "gtk-ok" is the name of a ready-made button.
std::string yadLabel(std::string_view label) {
    std::string escaped;
    for (const char c : asMarkup(withoutMnemonic(label)))
        if (c == '!')
            escaped += "&#33;";
        else if (c == '-')
            escaped += "&#45;";
        else
            escaped += c;
    return escaped;
}

/// In zenity a label is its text, and what is printed; a ready-made button's name gets a hyphen that is none.
std::string zenityLabel(std::string_view label) {
    std::string text = withoutMnemonic(label);
    if (text.starts_with("gtk-")) text.replace(3, 1, "\u2010");
    return text;
}

std::string bodyMarkup(const DialogTexts& texts) {
    return "<b><big>" + asMarkup(inLines(texts.header, kHeaderColumns)) + "</big></b>\n\n" +
           asMarkup(inLines(texts.message, kColumns)) + "\n\n<small>" + asMarkup(inLines(texts.application, kColumns)) +
           "</small>";
}

/// Whole or not at all: another dialog may be reading it.
bool writeFile(const std::string& path, std::string_view text) {
    std::string beside = path + ".XXXXXX";
    const Fd file(::mkostemp(beside.data(), O_CLOEXEC));
    if (!file) return false;
    if (::write(file.get(), text.data(), text.size()) == static_cast<ssize_t>(text.size()) &&
        ::rename(beside.c_str(), path.c_str()) == 0)
        return true;
    ::unlink(beside.c_str());
    return false;
}

std::string styleFile(const std::string& directory) {
    return directory + "/gtk-3.0/gtk.css";
}

}  // namespace

std::optional<DialogProgram> findDialogProgram(const std::vector<std::string>& directories, ProgramOwner owner) {
    using Kind = DialogProgram::Kind;
    for (const auto& [kind, name] : {std::pair(Kind::Yad, "/yad"), std::pair(Kind::Zenity, "/zenity")})
        for (const std::string& directory : directories)
            if (directory.starts_with('/') && mayRun(directory + name, owner))
                return DialogProgram{kind, directory + name};
    return std::nullopt;
}

std::optional<DialogTexts> dialogTexts(const AlertContent& content, const std::optional<std::string>& icon) {
    DialogTexts texts;
    texts.header = plainAlertText(content.header, kLongestHeader);
    texts.message = plainAlertText(content.message, kLongestMessage);
    texts.application = plainAlertText(content.application.text(), kLongestIdentifier);
    texts.defaultButton = plainAlertText(content.defaultButton, kLongestButton);
    if (content.alternateButton) texts.alternateButton = plainAlertText(*content.alternateButton, kLongestButton);
    texts.otherButton = plainAlertText(content.otherButton.value_or(""), kLongestButton);
    texts.icon = icon && isIcon(*icon) ? iconNamed(*icon) : kUnknownIcon;
    if (texts.defaultButton.empty() || texts.otherButton.empty() || texts.defaultButton == texts.otherButton)
        return std::nullopt;
    if (texts.alternateButton && (texts.alternateButton->empty() || *texts.alternateButton == texts.defaultButton ||
                                  *texts.alternateButton == texts.otherButton))
        return std::nullopt;
    return texts;
}

std::vector<std::string> dialogArguments(const DialogProgram& program, const DialogTexts& texts,
                                         const std::string& styleDirectory) {
    // Each value in one word with its option: none can be taken for an option of its own.
    std::vector<std::string> words{program.kind == DialogProgram::Kind::Yad ? "yad" : "zenity",
                                   std::string("--class=") + kDialogWindowClass, "--title=Lumacast",
                                   "--width=" + std::to_string(kWidth), "--text=" + bodyMarkup(texts)};
    if (program.kind == DialogProgram::Kind::Yad) {
        for (const std::string& word :
             {"--gtkrc=" + styleFile(styleDirectory), "--image=" + texts.icon, "--window-icon=" + texts.icon,
              std::string("--borders=16"), std::string("--center"), std::string("--fixed"), std::string("--on-top"),
              std::string("--buttons-layout=spread")})
            words.push_back(word);
        const auto add = [&](const std::string& label, int status) {
            words.push_back("--button=" + yadLabel(label) + ":" + std::to_string(status));
        };
        add(texts.otherButton, kOtherStatus);
        if (texts.alternateButton) add(*texts.alternateButton, kAlternateStatus);
        add(texts.defaultButton, kDefaultStatus);
        return words;
    }
    words.insert(words.end(), {"--question", "--switch"});
    // It knows icons by their names only.
    words.push_back("--icon-name=" + (texts.icon.front() == '/' ? std::string(kUnknownIcon) : texts.icon));
    const auto add = [&](const std::string& label) { words.push_back("--extra-button=" + zenityLabel(label)); };
    add(texts.otherButton);
    if (texts.alternateButton) add(*texts.alternateButton);
    add(texts.defaultButton);
    return words;
}

bool writeDialogStyle(const std::string& directory) {
    ::mkdir(directory.c_str(), 0700);
    ::mkdir((directory + "/gtk-3.0").c_str(), 0700);
    return writeFile(styleFile(directory), kStyle);
}

UserAlert::Response responseOf(const DialogProgram& program, const DialogTexts& texts, const DialogEnd& end) {
    using Response = UserAlert::Response;
    if (!end.exitStatus) return Response::OtherButton;
    if (program.kind == DialogProgram::Kind::Yad) {
        if (!end.output.empty()) return Response::OtherButton;
        if (*end.exitStatus == kDefaultStatus) return Response::DefaultButton;
        if (*end.exitStatus == kAlternateStatus && texts.alternateButton) return Response::AlternateButton;
        return Response::OtherButton;
    }
    // Its exit status says nothing: 0 also when another client destroys the window.
    if (*end.exitStatus != 1) return Response::OtherButton;
    if (end.output == zenityLabel(texts.defaultButton) + "\n") return Response::DefaultButton;
    if (texts.alternateButton && end.output == zenityLabel(*texts.alternateButton) + "\n")
        return Response::AlternateButton;
    return Response::OtherButton;
}

}  // namespace lumacast
