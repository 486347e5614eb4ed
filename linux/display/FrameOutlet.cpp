#include "linux/display/FrameOutlet.h"

#include <utility>

namespace lumacast::x11 {

Telling failure(std::int32_t status) {
    return [status](auto& delegate, auto& source) { delegate.screenCaptureControllerDidFailWithStatus(source, status); };
}

void tellOfEnd(std::uint64_t run, const std::shared_ptr<CaptureControl>& control,
               std::weak_ptr<DisplayCaptureSource> source, Scheduler& scheduler, Telling telling) {
    scheduler.mainQueue().async([run, control, source = std::move(source), telling = std::move(telling)] {
        const auto ended = source.lock();
        const auto delegate = control->delegateOfEnded(run);
        if (ended && delegate) telling(*delegate, *ended);
    });
}

FrameOutlet::Outcome FrameOutlet::deliver(const Order& order, std::shared_ptr<SharedPlane> picture, MediaTime& stamp,
                                          CaptureControl::Stamp kind, std::uint32_t transformFlags) {
    const auto source = setup_.source.lock();
    const auto delegate = setup_.control->delegate();
    if (!source || !delegate) return Outcome::ToNobody;
    const auto given = setup_.control->beginDelivery(order, stamp, kind);
    if (!given) return Outcome::OrderChanged;
    stamp = *given;
    delegate->screenCaptureControllerDidReceiveSampleBuffer(
        *source, samples_.video(PixelBuffer(std::move(picture)), stamp, setup_.minimumInterval), transformFlags);
    setup_.control->countDelivered();
    setup_.control->endDelivery();
    return Outcome::Delivered;
}

void FrameOutlet::end(const Order& order, Telling telling) {
    if (!setup_.control->endRun(order)) return;
    tellOfEnd(order.run, setup_.control, setup_.source, *setup_.scheduler, std::move(telling));
}

}  // namespace lumacast::x11
