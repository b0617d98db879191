#include "bake/texture_bake_run.h"

#include <algorithm>
#include <chrono>
#include <cmath>

#include "bake/bilinear_filter.h"
#include "bake/render_world.h"
#include "core/message.h"
#include "core/random.h"
#include "raytrace/instance.h"
#include "render/command.h"
#include "render/post_filter.h"
#include "render/render_context.h"
#include "render/tile_renderer.h"
#include "scene/scene.h"
#include "shading/material.h"
#include "shading/pass.h"

namespace ox {

/// Settings of the run as plain values, and what every target shares.
struct TextureBakeRun::Shared {
    RenderPassSet passes;
    Vec3 eye;
    bool orthoRefl = true;
    int32_t normalDirection = 0;
    bool viewDependent = false;
    bool conservative = false;
    bool shadows = false;
    bool alpha = false;
    float edgeBias = 0.0f;
    float rgbScale = 1.0f, alphaScale = 1.0f;
    bool clamp = false;
    Color colorMin, colorMax, background;
    int32_t baseRate = 0, maxRate = 0;  // samples per texel edge: 2^rate
    float contrast = 0.1f;
    int32_t edgeDilation = 5;
    bool bilinear = true;
    bool premultiply = true;
    float premultiplyThreshold = 0.0f;
    bool normalize = false;
    NormalizeOptions normalizeOptions;
    Vec2i frameResolution;
};

/// One target: resolved once, kept for every pass.
struct TextureBakeRun::Target : public TexelInstanceInterface {
    std::string name;
    const BakeTextureTargetBase *settings = nullptr;
    BakeTargetSize size;
    bool resolved = false;
    bool usable = false;
    std::vector<ResolvedBakeShape> shapes;
    std::vector<int32_t> tangentSets;  // per shape: the UV set of the tangent frame
    UvMeshSearch search;
    std::unique_ptr<Frame> frame;
    std::vector<MinMaxData> minMax;  // per colour layer of the last normalized pass

    void instancesOfRow(int32_t y, int32_t width, int32_t *ids) const override {
        for (int32_t x = 0; x < width; ++x) ids[x] = search.find(x + 0.5f, y + 0.5f).shape;
    }
    int32_t instanceCount() const override { return int32_t(shapes.size()); }
    std::string instanceName(int32_t i) const override { return shapes[size_t(i)].name; }
};

namespace {

constexpr const char *kWorkLayer = "beauty";
constexpr int32_t kBakeTile = 64;
constexpr int kMaxOutputs = 8;

double secondsSince(std::chrono::steady_clock::time_point t0) {
    return std::chrono::duration<double>(std::chrono::steady_clock::now() - t0).count();
}

/// "tpIllumination" of a bake without shadows: the light arriving, unshadowed.
class UnshadowedIlluminationPass final : public RenderPass {
public:
    UnshadowedIlluminationPass() : RenderPass("tpIllumination") {}
    Color shade(ShadingContext &ctx, const SurfaceShaderInterface &shader) const override {
        if (ctx.isGIRay()) return shader.shade(ctx);
        return gatherIllumination(ctx, false);
    }
};

/// The shading of bake samples: one per render thread and one for the filter chain.
class TexelShader {
public:
    TexelShader(const RenderWorld &world, const TextureBakeRun::Shared &shared,
                const TextureBakeRun::Target &target, const RenderPass &pass)
        : shared_(shared), target_(target), pass_(pass) {
        ctx_.scene = &world.shading();
        ctx_.rays = &rays_;
        ctx_.random = &ownRandom_;
        outputs_ = std::min(pass.outputCount(), kMaxOutputs);
    }
    int outputs() const { return outputs_; }
    void setRandom(Random &r) { ctx_.random = &r; }
    const RayCounter &rays() const { return rays_; }
    uint64_t samples = 0;

    /// Shades the surface under hit into out; false when the sample is background (the
    /// surface turns away from the eye).
    bool sample(const UvHit &hit, bool bias, Color *out) {
        float b1 = hit.b1, b2 = hit.b2;
        if (bias && shared_.edgeBias > 0.0f) {
            Vec2 c[3];
            target_.search.corners(hit, c);
            applyEdgeBias(c, shared_.edgeBias, b1, b2);
        }
        BakeSurface s;
        const size_t shape = size_t(hit.shape);
        fillBakeSurface(target_.shapes[shape], hit.triangle, b1, b2, target_.tangentSets[shape], s);
        if (!applyNormalDirection(s, shared_.normalDirection, shared_.viewDependent, shared_.eye))
            return false;
        shade(s, out);
        return true;
    }

private:
    void shade(const BakeSurface &s, Color *out) {
        SurfacePoint &p = ctx_.surface;
        p = SurfacePoint();
        p.position = s.position;
        p.geometricNormal = s.geometricNormal;
        p.normal = s.normal;
        p.tangent = s.tangent;
        p.bitangent = s.bitangent;
        p.color = s.color;
        p.uvSetCount = s.uvSetCount;
        for (uint32_t k = 0; k < s.uvSetCount; ++k) p.uvs[k].uv = s.uv[k];
        p.material = s.instance->material(s.triangle);
        p.instance = s.instance;
        p.instanceIndex = s.instanceIndex;
        p.flags = s.instance->flags();
        p.triangle = s.triangle;
        const Triangle &tri = s.instance->shape().triangles()[s.triangle];
        p.corners[0] = tri.v[0], p.corners[1] = tri.v[1], p.corners[2] = tri.v[2];
        p.backSide = false;
        // The view: straight down the normal (orthogonal reflections), or from the eye.
        Vec3 origin = s.position + s.normal, dir = -s.normal;
        if (!shared_.orthoRefl) {
            const Vec3 d = s.position - shared_.eye;
            if (d.lengthSquared() > 0.0f) origin = shared_.eye, dir = d.normalized();
        }
        ctx_.beginSample(origin, dir, kRayPrimary);
        ctx_.rayDistance = (s.position - origin).length();
        if (!shared_.shadows) ctx_.componentMask &= ~uint32_t(kShadeShadows);
        ++samples;
        const Material *m = materialOf(p.material);
        if (!m) {
            for (int i = 0; i < outputs_; ++i) out[i] = Color(0, 0, 0, 1);
        } else {
            pass_.shadeAll(ctx_, m->surface(), out);
        }
        for (int i = 0; i < outputs_; ++i) {
            Color &c = out[i];
            if (!shared_.alpha) c.a = 1.0f;
            c.r *= shared_.rgbScale, c.g *= shared_.rgbScale, c.b *= shared_.rgbScale;
            c.a *= shared_.alphaScale;
            if (shared_.clamp) {
                c.r = std::clamp(c.r, shared_.colorMin.r, shared_.colorMax.r);
                c.g = std::clamp(c.g, shared_.colorMin.g, shared_.colorMax.g);
                c.b = std::clamp(c.b, shared_.colorMin.b, shared_.colorMax.b);
                c.a = std::clamp(c.a, shared_.colorMin.a, shared_.colorMax.a);
            }
        }
    }

    const TextureBakeRun::Shared &shared_;
    const TextureBakeRun::Target &target_;
    const RenderPass &pass_;
    ShadingContext ctx_;
    RayCounter rays_;
    Random ownRandom_{1};
    int outputs_ = 1;
};

/// The tile renderer of one target and pass.
class TexelBaker final : public TileRenderer {
public:
    TexelBaker(const RenderWorld &world, const TextureBakeRun::Shared &shared,
               const TextureBakeRun::Target &target, const RenderPass &pass,
               std::vector<LayerT<Color> *> layers, LayerT<float> *z)
        : world_(world),
          shared_(shared),
          target_(target),
          pass_(pass),
          layers_(std::move(layers)),
          z_(z) {}

    TextureBakeCounts counts;
    RayCounter rays;

protected:
    bool prepare(int threadCount) override {
        threads_.clear();
        for (int i = 0; i < threadCount; ++i) {
            auto t = std::make_unique<Thread>(world_, shared_, target_, pass_);
            const size_t texels = size_t(kBakeTile) * size_t(kBakeTile);
            t->colors.resize(texels * layers_.size());
            t->z.resize(texels);
            threads_.push_back(std::move(t));
        }
        return true;
    }

    bool renderTile(int threadIndex, const Tile &tile) override {
        Thread &t = *threads_[size_t(threadIndex)];
        t.shader.setRandom(tileRandom(threadIndex));
        const int32_t w = int32_t(tile.width()), h = int32_t(tile.height());
        if (w > kBakeTile || h > kBakeTile) {
            message(kMsgError, 6, "Texture bake: tile of %dx%d texels exceeds %d", w, h, kBakeTile);
            return false;
        }
        const size_t n = layers_.size();
        for (int32_t j = 0; j < h; ++j)
            for (int32_t i = 0; i < w; ++i) {
                const size_t k = size_t(j) * size_t(w) + size_t(i);
                bakeTexel(t, int32_t(tile.xMin) + i, int32_t(tile.yMin) + j, i, j, w,
                          &t.colors[k * n], t.z[k], n);
            }
        // The buffers hold the layers interleaved; paste each layer from its own copy.
        const Region region(int32_t(tile.xMin), int32_t(tile.yMin), int32_t(tile.xMax) + 1,
                            int32_t(tile.yMax) + 1);
        for (size_t l = 0; l < n; ++l) {
            if (n == 1) {
                if (!layers_[0]->paste(region, t.colors.data())) return false;
                break;
            }
            t.plane.resize(size_t(w) * size_t(h));
            for (size_t k = 0; k < t.plane.size(); ++k) t.plane[k] = t.colors[k * n + l];
            if (!layers_[l]->paste(region, t.plane.data())) return false;
        }
        return z_->paste(region, t.z.data());
    }

    void threadFinished(int threadIndex) override {
        Thread &t = *threads_[size_t(threadIndex)];
        counts.texels += t.texels;
        counts.edgeTexels += t.edgeTexels;
        counts.samples += t.shader.samples;
        rays.merge(t.shader.rays());
    }

private:
    // Each thread's state on cache lines of its own: its counters and shading context are
    // written for every texel, and the records are allocated one after the other.
    struct alignas(64) Thread {
        Thread(const RenderWorld &w, const TextureBakeRun::Shared &s,
               const TextureBakeRun::Target &tg, const RenderPass &p)
            : shader(w, s, tg, p) {}
        TexelShader shader;
        std::vector<Color> colors, plane;
        std::vector<float> z;
        uint64_t texels = 0, edgeTexels = 0;
    };

    /// One texel: the centre (or the texel square, conservatively) decides coverage; texels
    /// crossed by a triangle edge or of high contrast to their left and lower neighbours take
    /// a regular grid of extra samples, averaged over the samples that find the surface.
    void bakeTexel(Thread &t, int32_t x, int32_t y, int32_t i, int32_t j, int32_t w, Color *out,
                   float &z, size_t n) {
        const UvMeshSearch &search = target_.search;
        const float cx = float(x) + 0.5f, cy = float(y) + 0.5f;
        UvHit hit = search.find(cx, cy);
        if (!hit.found() && shared_.conservative) hit = search.findNear(cx, cy, 0.5f, true);
        Color sample[kMaxOutputs];
        if (!hit.found() || !t.shader.sample(hit, true, sample)) {
            for (size_t l = 0; l < n; ++l) out[l] = shared_.background;
            z = -1.0f;
            return;
        }
        ++t.texels;
        z = float(hit.shape);
        Color sum[kMaxOutputs];
        int count = 0;
        auto grid = [&](int32_t rate, bool skipCentre) {
            const int32_t k = 1 << rate;
            for (int32_t sy = 0; sy < k; ++sy)
                for (int32_t sx = 0; sx < k; ++sx) {
                    const float px = float(x) + (float(sx) + 0.5f) / float(k);
                    const float py = float(y) + (float(sy) + 0.5f) / float(k);
                    if (skipCentre && px == cx && py == cy) continue;
                    const UvHit h = search.find(px, py);
                    if (!h.found() || !t.shader.sample(h, true, sample)) continue;
                    for (size_t l = 0; l < n; ++l) sum[l] += sample[l];
                    ++count;
                }
        };
        if (shared_.baseRate > 0) {
            grid(shared_.baseRate, false);
        } else {
            for (size_t l = 0; l < n; ++l) sum[l] = sample[l];
            count = 1;
        }
        if (shared_.maxRate > shared_.baseRate && count > 0) {
            bool edge = false;
            const float corner[4][2] = {{0, 0}, {1, 0}, {0, 1}, {1, 1}};
            for (const auto &c : corner) {
                const UvHit h = search.find(float(x) + c[0], float(y) + c[1]);
                if (!h.found() || h.shape != hit.shape || h.triangle != hit.triangle) {
                    edge = true;
                    break;
                }
            }
            if (!edge) {
                // Contrast to the texels already baked in this tile (left and below).
                const Color mine = sum[0] * (1.0f / float(count));
                auto differs = [&](const Color &o) {
                    return std::fabs(o.r - mine.r) > shared_.contrast ||
                           std::fabs(o.g - mine.g) > shared_.contrast ||
                           std::fabs(o.b - mine.b) > shared_.contrast;
                };
                if (i > 0 && differs(*(out - n))) edge = true;
                if (j > 0 && differs(*(out - size_t(w) * n))) edge = true;
            }
            if (edge) {
                ++t.edgeTexels;
                grid(shared_.maxRate, shared_.baseRate == 0);
            }
        }
        const float inv = 1.0f / float(std::max(count, 1));
        for (size_t l = 0; l < n; ++l) out[l] = sum[l] * inv;
    }

    const RenderWorld &world_;
    const TextureBakeRun::Shared &shared_;
    const TextureBakeRun::Target &target_;
    const RenderPass &pass_;
    std::vector<LayerT<Color> *> layers_;
    LayerT<float> *z_;
    std::vector<std::unique_ptr<Thread>> threads_;
};

/// The render command of the chain ("Texture Bake").
class TextureBakeCommand final : public FrameCommand {
public:
    TextureBakeCommand(TexelBaker &baker, const TileRunSettings &settings)
        : FrameCommand("Texture Bake"), baker_(baker), settings_(settings) {}
    using FrameCommand::execute;
    bool execute(Frame &, RenderContext &, RenderIOInterface &io) override {
        io.setProgressTitle("Baking Texture");
        const auto t0 = std::chrono::steady_clock::now();
        const bool ok = baker_.run(settings_, io);
        seconds = secondsSince(t0);
        return ok;
    }
    double seconds = 0.0;

private:
    TexelBaker &baker_;
    TileRunSettings settings_;
};

/// The remap a shape normalization applied to a texel of shape (from its record).
void normalizeLike(const MinMaxData &data, const NormalizeOptions &o, const std::string &shape,
                   Color &c) {
    const std::vector<ComponentMinMax> *comps = nullptr;
    if (o.component == NormalizeComponent::Image) {
        comps = &data.image;
    } else {
        for (const ShapeMinMax &s : data.shapes)
            if (s.shape == shape) comps = &s.components;
    }
    if (!comps) return;
    auto apply = [&](float &v, size_t k) {
        if (k >= comps->size() || !(*comps)[k].remapped) return;
        const ComponentMinMax &m = (*comps)[k];
        const float lo = o.range == NormalizeRange::MinMax ? m.minVal : 0.0f;
        v = (v - lo) * (1.0f / (m.maxVal - lo));
    };
    const bool linked = o.output == NormalizeOutput::Linked;
    apply(c.r, 0), apply(c.g, linked ? 0 : 1), apply(c.b, linked ? 0 : 2);
    if (o.alpha) apply(c.a, linked ? 1 : 3);
}

/// Resamples the continued surface for the bilinear filter, on the command thread.
class ChartResampler final : public SurfaceResampleInterface {
public:
    /// foldRnm: the chain folded the first three outputs into two before the filter.
    ChartResampler(TexelShader &shader, const TextureBakeRun::Shared &shared,
                   const TextureBakeRun::Target &target, bool foldRnm)
        : fold_(foldRnm), shader_(shader), shared_(shared), target_(target) {}
    bool resample(const UvHit &hit, int32_t, int32_t, Color *out) override {
        Color shaded[kMaxOutputs];
        if (!shader_.sample(hit, false, shaded)) return false;
        // The layers as the chain left them: the same steps as the covered texels took.
        int n = 0;
        if (fold_) {
            RNMAverageMaxFilter::fold(shaded[0], shaded[1], shaded[2], out);
            n = 2;
            for (int i = 3; i < shader_.outputs(); ++i) out[n++] = shaded[i];
        } else {
            for (int i = 0; i < shader_.outputs(); ++i) out[n++] = shaded[i];
        }
        if (shared_.normalize)
            for (int i = 0; i < n && size_t(i) < target_.minMax.size(); ++i)
                normalizeLike(target_.minMax[size_t(i)], shared_.normalizeOptions,
                              target_.shapes[size_t(hit.shape)].name, out[i]);
        return true;
    }

private:
    bool fold_;
    TexelShader &shader_;
    const TextureBakeRun::Shared &shared_;
    const TextureBakeRun::Target &target_;
};

/// Keeps the normalization's record on the target once the filter has run.
class KeepRecordCommand final : public FrameCommand {
public:
    KeepRecordCommand(const ShapeNormalizationFilter &filter, TextureBakeRun::Target &target,
                      size_t layer)
        : FrameCommand("Normalization Record", false, kMsgVerbose),
          filter_(filter),
          target_(target),
          layer_(layer) {}
    using FrameCommand::execute;
    bool execute(Frame &, RenderContext &, RenderIOInterface &) override {
        if (target_.minMax.size() <= layer_) target_.minMax.resize(layer_ + 1);
        target_.minMax[layer_] = filter_.record();
        return true;
    }

private:
    const ShapeNormalizationFilter &filter_;
    TextureBakeRun::Target &target_;
    size_t layer_;
};

}  // namespace

bool TextureBakeRun::foldsRnm(const RenderPass &pass) const {
    return pass.name() == "tpRnm" && shared_ && shared_->passes.rnm.monochrome &&
           pass.outputCount() >= 3;
}

TextureBakeRun::TextureBakeRun(const RenderWorld &world, const OXConfigBase &config,
                               int32_t threads)
    : world_(world), config_(config), threads_(std::max(1, threads)) {}

TextureBakeRun::~TextureBakeRun() = default;

std::vector<std::string> TextureBakeRun::componentPasses() const {
    return bakePassList(config_.TextureBakeSettings.RenderComponents);
}

int32_t TextureBakeRun::prepare(const std::vector<std::string> &passes) {
    const TextureBakeSettingsBase &tb = config_.TextureBakeSettings;
    if (passes.empty()) {
        message(kMsgWarning, 6, "No output specified, aborting baking");
        return kRunHardError;
    }
    if (tb.targets.size() == 0) {
        message(kMsgWarning, 6, "No targets specified, aborting baking");
        return kRunHardError;
    }
    const FrameSettingsBase &fs = config_.FrameSettings;
    if (!validateBakeTargets(tb, fs.resolution())) return kRunHardError;

    shared_ = std::make_unique<Shared>();
    Shared &s = *shared_;
    const RNMSettingsBase &rnm = tb.RenderComponents.RNMSettings;
    s.passes.rnm.adjustIntensity = rnm.adjustIntensity();
    s.passes.rnm.includeNormalComponent = rnm.includeNormalComponent();
    s.passes.rnm.allowNegative = rnm.allowNegative.value();
    s.passes.rnm.basis = rnm.basis.value();
    s.passes.rnm.components = rnm.components.value();
    s.passes.rnm.enableLambertianClamp = rnm.enableLambertianClamp();
    s.passes.rnm.lambertianClamp = rnm.lambertianClamp();
    s.passes.rnm.cosLobeExponent = rnm.cosLobeExponent();
    s.passes.rnm.monochrome = rnm.monochrome();
    // Without shadows the light arriving is gathered unshadowed.
    if (!tb.shadows()) s.passes.add(std::make_unique<UnshadowedIlluminationPass>());
    passes_ = passes;
    passObjects_.clear();
    for (const std::string &name : passes) {
        RenderPass *p = s.passes.find(name);
        if (!p) {
            message(kMsgError, 6, "The pass %s cannot be baked by this build.", name.c_str());
            return kRunHardError;
        }
        if (p->outputCount() > kMaxOutputs) {
            message(kMsgError, 6, "The pass %s has more than %d outputs.", name.c_str(),
                    kMaxOutputs);
            return kRunHardError;
        }
        if (!p->prepare()) return kRunHardError;
        passObjects_.push_back(p);
    }

    s.orthoRefl = tb.orthoRefl();
    s.normalDirection = tb.normalDirection.value();
    s.viewDependent = tb.viewDependent();
    s.conservative = tb.conservativeRasterization();
    s.shadows = tb.shadows();
    s.alpha = tb.alpha();
    s.edgeBias = std::max(0.0f, tb.edgeBias());
    s.rgbScale = tb.rgbScale();
    s.alphaScale = tb.alphaScale();
    s.clamp = tb.clamp();
    s.colorMin = tb.colorMin();
    s.colorMax = tb.colorMax();
    s.background = tb.bgColor();
    const AASettingsBase &aa = config_.AASettings;
    // Rates below 0 (fewer samples than texels) mean one sample per texel in a bake; the
    // largest grid is 16 x 16 samples.
    s.baseRate = std::clamp(aa.minSampleRate(), 0, 4);
    s.maxRate = std::clamp(aa.maxSampleRate(), s.baseRate, 4);
    s.contrast = aa.contrast();
    s.edgeDilation = tb.edgeDilation();
    s.bilinear = tb.bilinearFilter();
    s.premultiply = fs.premultiply();
    s.premultiplyThreshold = fs.premultiplyThreshold();
    const NormalizationBase &nb = tb.Normalize;
    s.normalize = nb.normalizeValues();
    s.normalizeOptions.range = nb.normalizeRange();
    s.normalizeOptions.output = nb.normalizeOutput();
    s.normalizeOptions.component = nb.normalizeComponent();
    s.normalizeOptions.alpha = nb.normalizeAlpha();
    s.frameResolution = fs.resolution();

    // The eye of view-dependent baking: the run's camera, else the scene box centre.
    const bool needsEye = s.normalDirection == int32_t(NormalDirectionType::Camera) ||
                          s.viewDependent || !s.orthoRefl;
    const Scene &scene = world_.scene();
    // Only the camera the frame settings name counts: the loader gives every scene a stand-in
    // camera, which says nothing about where the viewer is.
    if (const Camera *camera = scene.findCamera(fs.cameraName())) {
        s.eye = camera->position();
    } else {
        s.eye = world_.bounds().isEmpty() ? Vec3{} : world_.bounds().center();
        if (needsEye)
            message(kMsgWarning, 6,
                    "The scene has no camera %s: baking views the surfaces from the centre of "
                    "the scene box (%g, %g, %g).",
                    fs.cameraName().c_str(), s.eye.x, s.eye.y, s.eye.z);
    }

    targets_.clear();
    for (size_t i = 0; i < tb.targets.size(); ++i) {
        auto t = std::make_unique<Target>();
        t->settings = &tb.targets[i];
        t->name = tb.targets[i].textureName();
        t->size = bakeTargetSize(tb.targets[i], tb.resolutionScale(), fs.resolution());
        targets_.push_back(std::move(t));
    }
    current_ = -1;
    total_ = TextureBakeCounts();
    return kRunDone;
}

int32_t TextureBakeRun::targetCount() const { return int32_t(targets_.size()); }

std::string TextureBakeRun::targetName(int32_t index) const {
    return index >= 0 && size_t(index) < targets_.size() ? targets_[size_t(index)]->name : "";
}

int32_t TextureBakeRun::setupTarget(int32_t index) {
    if (index < 0 || size_t(index) >= targets_.size()) return kRunHardError;
    current_ = index;
    Target &t = *targets_[size_t(index)];
    if (t.resolved) return kRunDone;
    t.resolved = true;
    const TextureBakeSettingsBase &tb = config_.TextureBakeSettings;
    const auto t0 = std::chrono::steady_clock::now();
    t.shapes = resolveBakeShapes(tb, *t.settings, world_.scene());
    for (const ResolvedBakeShape &s : t.shapes) {
        int32_t set = -1;
        if (!tb.tangentUvSet().empty()) {
            set = s.instance->shape().vertices().findUvSet(tb.tangentUvSet());
            if (set < 0)
                message(kMsgWarning, 6,
                        "Instance %s has no UV set '%s' for tangents; the bake's set is used.",
                        s.instance->name().c_str(), tb.tangentUvSet().c_str());
        }
        t.tangentSets.push_back(set);
    }
    if (t.shapes.empty()) return kRunDone;  // renderTarget reports it
    const std::optional<UvRect> rect = bakeUvRect(tb, t.shapes, t.name);
    if (!rect) return kRunHardError;
    if (!t.search.build(t.shapes, *rect, int32_t(t.size.width), int32_t(t.size.height),
                        tb.windingOrder.value()))
        return kRunHardError;
    message(kMsgVerbose, 6, "Mesh Search Creation: %.3f s", secondsSince(t0));
    const UvCoverage c = t.search.coverage();
    if (c.overlapping > 0)
        message(kMsgWarning, 6,
                "Target %s: %lld of %lld covered texels lie under overlapping UV triangles; each "
                "is baked from one of them (the preferred winding, then the first).",
                t.name.c_str(), static_cast<long long>(c.overlapping),
                static_cast<long long>(c.covered));
    t.usable = true;
    return kRunDone;
}

Vec2i TextureBakeRun::frameSize() const {
    if (current_ < 0) return {};
    const Target &t = *targets_[size_t(current_)];
    return {int32_t(t.size.width), int32_t(t.size.height)};
}

Frame *TextureBakeRun::frame() {
    return current_ < 0 ? nullptr : targets_[size_t(current_)]->frame.get();
}

std::vector<std::string> TextureBakeRun::passLayers(int32_t pass) const {
    std::vector<std::string> names;
    if (pass < 0 || size_t(pass) >= passObjects_.size()) return names;
    const RenderPass &p = *passObjects_[size_t(pass)];
    for (int i = 0; i < p.outputCount(); ++i)
        if (i != 2 || !foldsRnm(p)) names.push_back(p.outputName(i));
    return names;
}

int32_t TextureBakeRun::renderTarget(int32_t pass, RenderIOInterface &io) {
    last_ = TextureBakeCounts();
    if (current_ < 0 || pass < 0 || size_t(pass) >= passObjects_.size()) return kRunHardError;
    Target &t = *targets_[size_t(current_)];
    if (!t.usable) {
        message(kMsgWarning, 6, "No shapes to bake, aborting baking");
        return kRunHardError;
    }
    if (!renderPass(t, pass, io)) return io.isAborted() ? kRunDone : kRunHardError;
    total_.texels += last_.texels;
    total_.samples += last_.samples;
    total_.edgeTexels += last_.edgeTexels;
    total_.rays += last_.rays;
    total_.renderSeconds += last_.renderSeconds;
    total_.filterSeconds += last_.filterSeconds;
    return kRunDone;
}

bool TextureBakeRun::renderPass(Target &t, int32_t passIndex, RenderIOInterface &io) {
    const Shared &s = *shared_;
    const RenderPass &pass = *passObjects_[size_t(passIndex)];
    const int outputs = pass.outputCount();
    const int32_t w = int32_t(t.size.width), h = int32_t(t.size.height);

    // The frame: new for every pass unless earlier passes' layers are kept.
    if (!t.frame || !keepPassLayers_) t.frame = std::make_unique<Frame>(w, h);
    Frame &frame = *t.frame;
    std::vector<std::string> sources;
    for (int i = 0; i < outputs; ++i) sources.push_back(i == 0 ? kWorkLayer : pass.outputName(i));
    auto drop = [&](const std::string &name) {
        if (frame.hasLayer(name)) frame.deleteLayer(name);
    };
    for (const std::string &name : sources) drop(name);
    for (int i = 0; i < outputs; ++i) drop(pass.outputName(i));
    drop("Z");
    std::vector<LayerT<Color> *> layers;
    for (const std::string &name : sources) {
        LayerT<Color> *l = frame.addTiledLayer<Color>(name, kBakeTile);
        if (!l) return false;
        layers.push_back(l);
    }
    LayerT<float> *z = frame.addTiledLayer<float>("Z", kBakeTile);
    if (!z) return false;

    TexelBaker baker(world_, s, t, pass, layers, z);
    TileRunSettings run;
    run.xMin = 0, run.yMin = 0;
    run.xMax = uint32_t(w - 1), run.yMax = uint32_t(h - 1);
    run.tileWidth = run.tileHeight = kBakeTile;
    run.scheme = config_.FrameSettings.tileScheme.value();
    run.threadCount = threads_;

    // The command chain of the target.
    CommandExecutor chain;
    auto bake = std::make_unique<TextureBakeCommand>(baker, run);
    TextureBakeCommand *bakeCommand = bake.get();
    chain.add(std::move(bake));
    if (foldsRnm(pass)) {
        // The three basis layers become two (the average in the first, the maxima in the
        // second); the filters that follow see those.
        chain.add(std::make_unique<PostFilterCommand>(
            std::make_unique<RNMAverageMaxFilter>(
                std::vector<std::string>{sources[0], sources[1], sources[2]},
                std::vector<std::string>{sources[0], sources[1]}),
            threads_));
        sources.erase(sources.begin() + 2);
    }
    if (s.premultiply)
        chain.add(std::make_unique<PostFilterCommand>(
            std::make_unique<PremultiplyFilter>(sources, s.premultiplyThreshold, s.background),
            threads_));
    std::vector<std::unique_ptr<ShapeNormalizationFilter>> normalizers;
    t.minMax.clear();
    if (s.normalize) {
        for (size_t i = 0; i < sources.size(); ++i) {
            auto f = std::make_unique<ShapeNormalizationFilter>(sources[i], s.normalizeOptions, &t);
            f->setThreadCount(threads_);
            const ShapeNormalizationFilter &ref = *f;
            chain.add(std::move(f));
            chain.add(std::make_unique<KeepRecordCommand>(ref, t, i));
        }
    }
    TexelShader filterShader(world_, s, t, pass);
    Random filterRandom(kDefaultRunSeed ^ 0x5bd1e995u);
    filterShader.setRandom(filterRandom);
    ChartResampler resampler(filterShader, s, t, foldsRnm(pass));
    if (s.bilinear) chain.add(std::make_unique<BilinearFilter>(sources, t.search, resampler));
    if (s.edgeDilation > 0 || s.bilinear) {
        // The margin reaches one texel past the dilation, so that the bilinear lookups of the
        // outermost dilated texels read no background either.
        auto f = std::make_unique<EdgeDilationFilter>(sources, s.edgeDilation + 1, s.background);
        f->setThreadCount(threads_);
        chain.add(std::move(f));
    }

    RenderContext context;
    context.threadCount = threads_;
    const auto t0 = std::chrono::steady_clock::now();
    RenderCmdThread thread(chain, frame, context, io);
    bool ok = thread.start();
    thread.join();
    ok = ok && thread.succeeded();
    const double total = secondsSince(t0);

    last_.texels = baker.counts.texels;
    last_.samples = baker.counts.samples + filterShader.samples;
    last_.edgeTexels = baker.counts.edgeTexels;
    RayCounter rays = baker.rays;
    rays.merge(filterShader.rays());
    last_.rays = rays.total();
    last_.renderSeconds = bakeCommand->seconds;
    last_.filterSeconds = std::max(0.0, total - bakeCommand->seconds);
    if (!ok) return false;
    // The results go by their output names.
    if (pass.outputName(0) != kWorkLayer && !frame.renameLayer(kWorkLayer, pass.outputName(0)))
        return false;
    return true;
}

const MinMaxData *TextureBakeRun::minMaxData() const {
    if (current_ < 0) return nullptr;
    const Target &t = *targets_[size_t(current_)];
    // The record of the pass's first layer, the one its files are named by.
    return t.minMax.empty() ? nullptr : &t.minMax.front();
}

void TextureBakeRun::statistics(RunStatistics &statistics) {
    statistics.count("texels", last_.texels);
    statistics.count("samples", last_.samples);
    statistics.count("edge texels", last_.edgeTexels);
    statistics.count("rays", last_.rays);
    statistics.count("bake microseconds", uint64_t(last_.renderSeconds * 1e6));
    statistics.count("filter microseconds", uint64_t(last_.filterSeconds * 1e6));
    last_ = TextureBakeCounts();
}

}  // namespace ox
