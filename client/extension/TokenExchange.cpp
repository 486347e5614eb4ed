#include "client/extension/TokenExchange.h"

#include <utility>

#include "linux/ipc/FileTokens.h"

namespace lumacast::extension {

void exchangeOverConnection(const std::shared_ptr<IpcConnection>& connection, Data token,
                            std::function<void(Fd file)> exchanged) {
    exchangeFileToken(connection, token, [exchanged = std::move(exchanged)](Fd file, const std::optional<Error>&) {
        exchanged(std::move(file));
    });
}

}  // namespace lumacast::extension
