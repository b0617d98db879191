#include "bake/bilinear_filter.h"

#include <algorithm>

#include "core/message.h"
#include "render/frame.h"

namespace ox {
namespace {

constexpr int32_t kBandRows = 64;

/// One texel to refill and where its colours start in the colour list.
struct Refill {
    int32_t x, y;
    float z;
    size_t colors;
};

}  // namespace

bool BilinearFilter::execute(Frame &frame, RenderContext &, RenderIOInterface &io) {
    return run(frame, &io);
}

bool BilinearFilter::run(Frame &frame, RenderIOInterface *io) {
    refilled_ = 0;
    const int32_t w = frame.width(), h = frame.height();
    LayerT<float> *z = frame.getFloatLayer("Z");
    if (!z) {
        message(kMsgError, 6, "Source Z layer not found in bilinear filter");
        return false;
    }
    std::vector<LayerT<Color> *> sources;
    for (const std::string &name : sources_) {
        LayerT<Color> *l = frame.getColorLayer(name);
        if (!l) {
            message(kMsgError, 6, "Source layer %s not found in bilinear filter", name.c_str());
            return false;
        }
        sources.push_back(l);
    }
    if (w <= 0 || h <= 0) return true;
    if (io) io->setProgressTitle("Bilinear Filter");

    // The coverage of the whole frame (4 bytes a texel, like one float layer).
    std::vector<float> cover(size_t(w) * size_t(h));
    if (!z->read(Region(0, 0, w, h), cover.data())) {
        message(kMsgError, 6, "Bilinear filter: reading the Z layer failed");
        return false;
    }
    auto covered = [&](int32_t x, int32_t y) {
        return cover[size_t(y) * size_t(w) + size_t(x)] >= 0.0f;
    };

    // Background texels with a covered neighbour, resampled in row order. The search's
    // reach of 1.5 texels takes every triangle that meets the texel's 3 x 3 neighbourhood,
    // so the surface continued is the one nearest to the texel centre.
    std::vector<Refill> refills;
    std::vector<Color> colors;
    const size_t n = sources.size();
    std::vector<Color> out(std::max<size_t>(n, 1));
    for (int32_t y = 0; y < h; ++y) {
        if (io && io->isAborted()) return false;
        for (int32_t x = 0; x < w; ++x) {
            if (covered(x, y)) continue;
            bool next = false;
            for (int32_t dy = -1; dy <= 1 && !next; ++dy)
                for (int32_t dx = -1; dx <= 1 && !next; ++dx) {
                    const int32_t nx = x + dx, ny = y + dy;
                    next = nx >= 0 && ny >= 0 && nx < w && ny < h && covered(nx, ny);
                }
            if (!next) continue;
            const UvHit hit = search_.findNear(float(x) + 0.5f, float(y) + 0.5f, 1.5f, false);
            if (!hit.found() || !resampler_.resample(hit, x, y, out.data())) continue;
            refills.push_back({x, y, float(hit.shape), colors.size()});
            colors.insert(colors.end(), out.begin(), out.begin() + std::ptrdiff_t(n));
        }
        if (io && (y + 1) % kBandRows == 0) io->setProgress(float(y + 1) / float(h) * 0.5f);
    }

    // Results: copies of the sources and of Z with the refilled texels, written band by band.
    std::vector<std::string> made;
    auto discard = [&] {
        for (const std::string &name : made) frame.deleteLayer(name);
    };
    std::vector<LayerT<Color> *> results;
    for (const std::string &name : sources_) {
        LayerT<Color> *r = frame.addTiledLayer<Color>(name + "_bilinear");
        if (!r) {
            discard();
            return false;
        }
        made.push_back(name + "_bilinear");
        results.push_back(r);
    }
    LayerT<float> *zr = frame.addTiledLayer<float>("Z_bilinear");
    if (!zr) {
        discard();
        return false;
    }
    made.push_back("Z_bilinear");

    std::vector<Color> band(size_t(w) * kBandRows);
    size_t first = 0;  // first refill of the current band
    for (int32_t y0 = 0; y0 < h; y0 += kBandRows) {
        if (io && io->isAborted()) {
            discard();
            return false;
        }
        const int32_t y1 = std::min(h, y0 + kBandRows);
        const Region region(0, y0, w, y1);
        size_t last = first;
        while (last < refills.size() && refills[last].y < y1) ++last;
        for (size_t s = 0; s < n; ++s) {
            if (!sources[s]->read(region, band.data())) {
                message(kMsgError, 6, "Bilinear filter: reading layer %s failed",
                        sources_[s].c_str());
                discard();
                return false;
            }
            for (size_t k = first; k < last; ++k)
                band[size_t(refills[k].y - y0) * size_t(w) + size_t(refills[k].x)] =
                    colors[refills[k].colors + s];
            if (!results[s]->paste(region, band.data())) {
                discard();
                return false;
            }
        }
        float *zb = cover.data() + size_t(y0) * size_t(w);
        for (size_t k = first; k < last; ++k)
            zb[size_t(refills[k].y - y0) * size_t(w) + size_t(refills[k].x)] = refills[k].z;
        if (!zr->paste(region, zb)) {
            discard();
            return false;
        }
        first = last;
        if (io) io->setProgress(0.5f + 0.5f * float(y1) / float(h));
    }

    // Placement: the results take the sources' names.
    for (size_t s = 0; s < n; ++s) {
        frame.deleteLayer(sources_[s]);
        frame.renameLayer(sources_[s] + "_bilinear", sources_[s]);
    }
    frame.deleteLayer("Z");
    frame.renameLayer("Z_bilinear", "Z");
    refilled_ = int64_t(refills.size());
    if (io) io->finish();
    return true;
}

}  // namespace ox
