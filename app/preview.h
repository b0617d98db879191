#pragma once

#include <cstdint>

#include "core/render_io.h"

/// The slot of the preview window: an observer of the frame that the camera/bake driver makes
/// and the run waits for after a successful run.
namespace ox {

/// A display of the frame being rendered.
class PreviewObserverInterface {
public:
    virtual ~PreviewObserverInterface() = default;
    /// The display gamma it was made with.
    virtual float gamma() const = 0;
    /// The frame of the next target has this size.
    virtual void resize(int32_t width, int32_t height) = 0;
    /// Returns when the display is closed or io is aborted (or released).
    virtual void waitUntilClosed(RenderIOInterface &io) = 0;
};

/// The observer of runs without a window (-d, -n, or a build without the preview window):
/// remembers the size and never waits.
class NullPreviewObserver final : public PreviewObserverInterface {
public:
    explicit NullPreviewObserver(float gamma = 1.0f) : gamma_(gamma) {}
    float gamma() const override { return gamma_; }
    void resize(int32_t width, int32_t height) override {
        width_ = width;
        height_ = height;
    }
    void waitUntilClosed(RenderIOInterface &) override {}
    /// The last size given to resize.
    int32_t width() const { return width_; }
    /// The last size given to resize.
    int32_t height() const { return height_; }

private:
    float gamma_;
    int32_t width_ = 0, height_ = 0;
};

}  // namespace ox
