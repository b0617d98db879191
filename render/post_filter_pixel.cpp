#include <algorithm>
#include <cmath>
#include <vector>

#include "core/message.h"
#include "render/frame.h"
#include "render/post_filter.h"

namespace ox {

namespace {

/// The name of premultiply result i: "temp", then "temp1", "temp2", ...
std::string tempName(size_t i) { return i == 0 ? std::string("temp") : "temp" + std::to_string(i); }

Region rowsOf(int32_t width, int32_t y0, int32_t y1) { return Region(0, y0, width, y1); }

}  // namespace

// ---------------------------------------------------------------------------------------------
// Premultiply

bool PremultiplyFilter::init(Frame &frame, RenderContext &) {
    in_.clear();
    out_.clear();
    runs_.clear();
    inPlace_.clear();
    pixelUndo_.clear();
    for (const std::string &name : sources_) {
        LayerT<Color> *layer = frame.getColorLayer(name);
        if (!layer) {
            message(kMsgError, 6, "Source layer %s not found in premultiply filter", name.c_str());
            return false;
        }
        in_.push_back(layer);
    }
    results_ = std::make_unique<FilterResults>(frame);
    // Distinct sources that allow it are rewritten in place: only their semi-transparent
    // texels are touched. The result names must be free all the same.
    bool inPlace = true;
    for (size_t i = 0; i < in_.size(); ++i)
        inPlace = inPlace && InPlaceTexels::possible(*in_[i]) &&
                  std::find(in_.begin(), in_.begin() + ptrdiff_t(i), in_[i]) ==
                      in_.begin() + ptrdiff_t(i);
    if (inPlace) {
        for (size_t i = 0; i < sources_.size(); ++i)
            if (!results_->nameFree(tempName(i), "premultiply filter")) return false;
        for (size_t i = 0; i < sources_.size() && inPlace; ++i) {
            inPlace_.push_back(std::make_unique<InPlaceTexels>(*in_[i], frame.scratch()));
            inPlace = inPlace_.back()->ok();
        }
        if (inPlace) return true;
        // Without room for the originals the results go to new layers after all.
        inPlace_.clear();
    }
    for (size_t i = 0; i < sources_.size(); ++i) {
        LayerT<Color> *out = results_->addColor(tempName(i), sources_[i], "premultiply filter");
        if (!out) return false;
        out_.push_back(out);
    }
    for (size_t i = 0; i < sources_.size(); ++i)
        runs_.push_back(std::make_unique<TexelRuns>(*in_[i], out_[i], nullptr));
    return true;
}

bool PremultiplyFilter::filterRows(int32_t y0, int32_t y1, BandScratch &scratch, int32_t &failedX,
                                   int32_t &failedY) {
    const float t = threshold_;
    const Color bg = background_;
    for (const auto &texels : inPlace_)
        texels->run(
            y0, y1, scratch, [&](int32_t, int32_t, const Color &c) { return chosen(c); },
            [&](int32_t, int32_t, Color &c) { c = premultiply(c, t, bg); });
    for (const auto &runs : runs_) {
        const bool ok = runs->run(
            y0, y1, scratch,
            [&](int32_t, int32_t, int32_t n, const Color *src, Color *dst, const float *) {
                for (int32_t i = 0; i < n; ++i) dst[i] = premultiply(src[i], t, bg);
            });
        if (!ok) {
            failedX = 0, failedY = y0;
            return false;
        }
    }
    return true;
}

bool PremultiplyFilter::filterPixel(int32_t x, int32_t y) {
    if (!inPlace_.empty()) {
        for (size_t l = 0; l < inPlace_.size(); ++l) {
            Color &c = inPlace_[l]->at(x, y);
            if (!chosen(c)) continue;
            pixelUndo_.push_back({l, x, y, c});
            c = premultiply(c, threshold_, background_);
        }
        return true;
    }
    runs_.clear();  // the layers are then used through reads and pastes
    const Region r(x, y, x + 1, y + 1);
    for (size_t l = 0; l < in_.size(); ++l) {
        Color c;
        if (!in_[l]->read(r, &c)) return false;
        c = premultiply(c, threshold_, background_);
        if (!out_[l]->paste(r, &c)) return false;
    }
    return true;
}

bool PremultiplyFilter::finish(Frame &) {
    runs_.clear();
    // Sources rewritten in place are the results already.
    const bool ok = !inPlace_.empty() || (results_ && results_->place(sources_));
    inPlace_.clear();
    pixelUndo_.clear();
    results_.reset();
    return ok;
}

void PremultiplyFilter::discard(Frame &) {
    runs_.clear();
    for (auto it = pixelUndo_.rbegin(); it != pixelUndo_.rend(); ++it)
        inPlace_[it->layer]->at(it->x, it->y) = it->original;
    pixelUndo_.clear();
    for (const auto &texels : inPlace_)
        texels->restore([&](int32_t, int32_t, const Color &c) { return chosen(c); });
    inPlace_.clear();
    results_.reset();  // removes what was not placed
}

// ---------------------------------------------------------------------------------------------
// Range remap

namespace {

/// The scale and offset that map [lo, hi] to [0, 1]; 1 and 0 for an empty or unusable range.
void rangeScale(bool on, float lo, float hi, float &scale, float &offset) {
    scale = 1.0f;
    offset = 0.0f;
    const float span = hi - lo;
    if (on && std::isfinite(span) && span > 0.0f && std::isfinite(1.0f / span)) {
        scale = 1.0f / span;
        offset = -lo;
    }
}

}  // namespace

bool RangeRemapFilter::init(Frame &frame, RenderContext &) {
    in_ = frame.getColorLayer(source_);
    if (!in_) {
        message(kMsgError, 6, "Source layer %s not found in range remap filter", source_.c_str());
        return false;
    }
    z_ = frame.getFloatLayer("Z");
    message(kMsgInfo, 6, "Initialising range remap filter...");

    // Only covered texels count, and only finite values: one infinite texel would otherwise
    // squash every other texel to 0.
    float rgbMin = 3.4028235e38f, rgbMax = -3.4028235e38f;
    float aMin = 3.4028235e38f, aMax = -3.4028235e38f;
    const int32_t w = in_->width(), h = in_->height();
    const int32_t band = kFilterBandRows;
    std::vector<Color> colors(size_t(w) * band);
    std::vector<float> z(z_ ? size_t(w) * band : 0);
    for (int32_t y0 = 0; y0 < h; y0 += band) {
        const Region rows = rowsOf(w, y0, std::min(h, y0 + band));
        if (!in_->read(rows, colors.data()) || (z_ && !z_->read(rows, z.data()))) return false;
        for (int64_t i = 0; i < rows.area(); ++i) {
            if (z_ && !(z[size_t(i)] >= 0.0f)) continue;
            const Color &c = colors[size_t(i)];
            for (float v : {c.r, c.g, c.b})
                if (std::isfinite(v)) rgbMin = std::min(rgbMin, v), rgbMax = std::max(rgbMax, v);
            if (std::isfinite(c.a)) aMin = std::min(aMin, c.a), aMax = std::max(aMax, c.a);
        }
    }
    if (rgbMin > rgbMax) rgbMin = rgbMax = 0.0f;
    if (aMin > aMax) aMin = aMax = 0.0f;
    rangeScale(remapRGB_, rgbMin, rgbMax, rgbScale_, rgbOffset_);
    rangeScale(remapAlpha_, aMin, aMax, alphaScale_, alphaOffset_);
    message(kMsgInfo, 6, "Found rgb range         : [%2.4f - %2.4f]", double(rgbMin),
            double(rgbMax));
    message(kMsgInfo, 6, "Found alpha range       : [%2.4f - %2.4f]", double(aMin), double(aMax));
    message(kMsgInfo, 6, "Calculated rgb scale    : %f", double(rgbScale_));
    message(kMsgInfo, 6, "Calculated rgb offset   : %f", double(rgbOffset_));
    message(kMsgInfo, 6, "Calculated alpha scale  : %f", double(alphaScale_));
    message(kMsgInfo, 6, "Calculated alpha offset : %f", double(alphaOffset_));

    results_ = std::make_unique<FilterResults>(frame);
    out_ = results_->addColor("temp", source_, "range remap filter");
    return out_ != nullptr;
}

bool RangeRemapFilter::filterRows(int32_t y0, int32_t y1, BandScratch &scratch, int32_t &failedX,
                                  int32_t &failedY) {
    const Region rows = rowsOf(in_->width(), y0, y1);
    const size_t n = size_t(rows.area());
    Color *buffer = scratch.colorBuffer(n);
    float *z = z_ ? scratch.floatBuffer(n) : nullptr;
    if (!in_->read(rows, buffer) || (z_ && !z_->read(rows, z))) {
        failedX = 0, failedY = y0;
        return false;
    }
    for (size_t i = 0; i < n; ++i) {
        if (z_ && !(z[i] >= 0.0f)) continue;
        Color &c = buffer[i];
        c = Color((c.r + rgbOffset_) * rgbScale_, (c.g + rgbOffset_) * rgbScale_,
                  (c.b + rgbOffset_) * rgbScale_, (c.a + alphaOffset_) * alphaScale_);
    }
    if (!out_->paste(rows, buffer)) {
        failedX = 0, failedY = y0;
        return false;
    }
    return true;
}

bool RangeRemapFilter::filterPixel(int32_t x, int32_t y) {
    ScratchPool pool;
    BandScratch scratch(pool);
    int32_t fx, fy;
    return filterRows(y, y + 1, scratch, fx, fy);  // one texel costs as much as its row here
}

bool RangeRemapFilter::finish(Frame &) {
    const bool ok = results_ && results_->place({source_});
    results_.reset();
    return ok;
}

void RangeRemapFilter::discard(Frame &) {
    results_.reset();  // removes what was not placed
}

// ---------------------------------------------------------------------------------------------
// RNM average / max

void RNMAverageMaxFilter::fold(const Color &c0, const Color &c1, const Color &c2, Color out[2]) {
    const float third = 1.0f / 3.0f;
    const Color avg((c0.r + c1.r + c2.r) * third, (c0.g + c1.g + c2.g) * third,
                    (c0.b + c1.b + c2.b) * third, (c0.a + c1.a + c2.a) * third);
    const float m = std::max(avg.r, std::max(avg.g, avg.b));
    out[0] = std::fabs(m) > 1e-7f ? avg * (1.0f / m) : avg;
    out[1] = Color(std::max(c0.r, std::max(c0.g, c0.b)), std::max(c1.r, std::max(c1.g, c1.b)),
                   std::max(c2.r, std::max(c2.g, c2.b)), avg.a);
}

bool RNMAverageMaxFilter::init(Frame &frame, RenderContext &) {
    if (sources_.size() != 3 || outputs_.size() != 2) {
        message(kMsgError, 6,
                "RNM Average/Max filter needs three source layers and two output layers "
                "(got %zu and %zu)",
                sources_.size(), outputs_.size());
        return false;
    }
    for (int i = 0; i < 3; ++i) {
        in_[i] = frame.getColorLayer(sources_[size_t(i)]);
        if (!in_[i]) {
            message(kMsgError, 6, "Source layer %s not found in RNM Average/Max filter",
                    sources_[size_t(i)].c_str());
            return false;
        }
    }
    results_ = std::make_unique<FilterResults>(frame);
    for (int k = 0; k < 2; ++k) {
        out_[k] = results_->addColor(outputs_[size_t(k)] + "_rnmaveragemax", outputs_[size_t(k)],
                                     "RNM Average/Max filter");
        if (!out_[k]) return false;
    }
    return true;
}

bool RNMAverageMaxFilter::filterRows(int32_t y0, int32_t y1, BandScratch &scratch, int32_t &failedX,
                                     int32_t &failedY) {
    const Region rows = rowsOf(in_[0]->width(), y0, y1);
    const size_t n = size_t(rows.area());
    Color *c = scratch.colorBuffer(n * 5), *o = c + n * 3;
    for (int i = 0; i < 3; ++i)
        if (!in_[i]->read(rows, c + n * size_t(i))) {
            failedX = 0, failedY = y0;
            return false;
        }
    for (size_t t = 0; t < n; ++t) {
        Color out[2];
        fold(c[t], c[n + t], c[2 * n + t], out);
        o[t] = out[0];
        o[n + t] = out[1];
    }
    if (!out_[0]->paste(rows, o) || !out_[1]->paste(rows, o + n)) {
        failedX = 0, failedY = y0;
        return false;
    }
    return true;
}

bool RNMAverageMaxFilter::filterPixel(int32_t x, int32_t y) {
    const Region r(x, y, x + 1, y + 1);
    Color c[3], out[2];
    for (int i = 0; i < 3; ++i)
        if (!in_[i]->read(r, &c[i])) return false;
    fold(c[0], c[1], c[2], out);
    return out_[0]->paste(r, &out[0]) && out_[1]->paste(r, &out[1]);
}

bool RNMAverageMaxFilter::finish(Frame &) {
    const bool ok = results_ && results_->place(sources_);
    results_.reset();
    return ok;
}

void RNMAverageMaxFilter::discard(Frame &) {
    results_.reset();  // removes what was not placed
}

}  // namespace ox
