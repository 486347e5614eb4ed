#pragma once
#include <string_view>

namespace lumacast::extensions {

/// The text of watch.html: a page that plays the playlist that lies beside it.
std::string_view watchPage();

}  // namespace lumacast::extensions
