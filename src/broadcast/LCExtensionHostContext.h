#pragma once
#include <memory>

#include "base/Log.h"
#include "platform/AppExtension.h"

namespace lumacast {

/// The daemon's side of a request to a broadcast extension: types the auxiliary connection.
class LCExtensionHostContext final : public ExtensionContext {
public:
    LCExtensionHostContext(Log& log, std::weak_ptr<IpcConnection> auxiliaryConnection)
        : log_(log), auxiliaryConnection_(std::move(auxiliaryConnection)) {}

    /// `_extensionAuxiliaryHostProtocol`
    static const Protocol& _extensionAuxiliaryHostProtocol() { return extensionHostProtocol(); }
    /// `_extensionAuxiliaryVendorProtocol`
    static const Protocol& _extensionAuxiliaryVendorProtocol() { return extensionVendorProtocol(); }
    /// What the platform makes its requests' contexts of.
    static ExtensionContextClass contextClass(Log& log) {
        return {&_extensionAuxiliaryHostProtocol(), &_extensionAuxiliaryVendorProtocol(),
                [&log](std::weak_ptr<IpcConnection> auxiliary) {
                    return std::make_shared<LCExtensionHostContext>(log, std::move(auxiliary));
                }};
    }

    void didConnectToVendor() override { log_.line("Connected to extension."); }
    std::shared_ptr<IpcConnection> auxiliaryConnection() const override { return auxiliaryConnection_.lock(); }

private:
    Log& log_;
    const std::weak_ptr<IpcConnection> auxiliaryConnection_;
};

}  // namespace lumacast
