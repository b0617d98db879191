#include "core/render_io_console.h"

#include <algorithm>
#include <cmath>

#include "core/message.h"

namespace ox {

RioImpl::RioImpl(float step) {
    if (std::isnan(step)) step = kDefaultStep;
    step_ = std::clamp(step, kMinStep, 1.0f);
}

bool RioImpl::isAborted() const { return aborted_.load(std::memory_order_relaxed); }

bool RioImpl::isReleased() {
    std::lock_guard<std::mutex> lock(mutex_);
    return released_;
}

void RioImpl::setProgressTitle(const std::string &title) {
    std::lock_guard<std::mutex> lock(mutex_);
    message(kMsgProgress, 6, "Progress Title: %s", title.c_str());
}

void RioImpl::beginCommand() {}

void RioImpl::endCommand() {}

void RioImpl::finish() {
    if (isAborted()) {
        std::lock_guard<std::mutex> lock(mutex_);
        message(kMsgProgress, 6, "Aborted!");
        return;
    }
    setProgress(step_ * 0.5f + 1.0f);
}

void RioImpl::setProgress(float fraction) {
    if (std::isnan(fraction)) return;
    const double step = step_;
    // Bounding the fraction bounds the number of lines: at most 1 / step + 1 per phase.
    const double f = std::clamp(static_cast<double>(fraction), 0.0, 1.0 + step * 0.5);
    std::lock_guard<std::mutex> lock(mutex_);
    // A fraction below the last mark means that a new phase began.
    if (static_cast<double>(marks_) * step > f) marks_ = 0;
    while (f >= static_cast<double>(marks_) * step + 0.9999 * step) {
        ++marks_;
        message(kMsgProgress, 6, "Progress %.1f%%", static_cast<double>(marks_) * step * 100.0);
    }
}

void RioImpl::abort() {
    std::lock_guard<std::mutex> lock(mutex_);
    aborted_.store(true, std::memory_order_relaxed);
}

void RioImpl::release() {
    std::lock_guard<std::mutex> lock(mutex_);
    released_ = true;
}

void RioImpl::clearRelease() {
    std::lock_guard<std::mutex> lock(mutex_);
    released_ = false;
}

void RioImpl::refreshDisplay() {}

float RioImpl::lastProgress() {
    std::lock_guard<std::mutex> lock(mutex_);
    return static_cast<float>(static_cast<double>(marks_) * step_);
}

}  // namespace ox
