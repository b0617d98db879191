#pragma once

#include <cstdint>
#include <map>
#include <memory>
#include <string>
#include <vector>

#include "core/types.h"
#include "shading/shader.h"
#include "shading/shading_context.h"

/// Render passes: what part of the shading a layer of the output receives.
///
/// A caller (camera render, texture bake) gets its passes once per run from a RenderPassSet by
/// name, calls prepare() before rendering and finish() after, and per sample:
///   - single-output passes: Color c = pass.shade(ctx, material);
///   - passes with several outputs (outputCount() > 1, e.g. "tpRnm"): pass.shadeAll(ctx,
///     material, colours) fills outputCount() colours, written to the layers outputName(i).
/// A sample that hits nothing takes environmentColor(ctx) (shading/trace.h) in "beauty" and
/// background in the other passes. Passes are read-only while rendering and shared by threads.
namespace ox {

/// Base of every pass.
class RenderPass {
public:
    explicit RenderPass(std::string name) : name_(std::move(name)) {}
    /// The pass's colour at the context's point shaded by shader. The context's component
    /// mask may be changed by the pass.
    virtual Color shade(ShadingContext &ctx, const SurfaceShaderInterface &shader) const = 0;
    virtual ~RenderPass() = default;
    RenderPass(const RenderPass &) = delete;
    RenderPass &operator=(const RenderPass &) = delete;
    /// Called once before rendering; false (after one message) stops the run.
    virtual bool prepare() { return true; }
    /// Called once after rendering.
    virtual void finish() {}

    /// Number of colours per sample (1 for most passes).
    virtual int outputCount() const { return 1; }
    /// Layer name of output i (the pass name for a single output).
    virtual std::string outputName(int i) const { return name_; }
    /// Every output of one sample into out[0 .. outputCount() - 1].
    virtual void shadeAll(ShadingContext &ctx, const SurfaceShaderInterface &shader,
                          Color *out) const {
        out[0] = shade(ctx, shader);
    }

    /// The pass name ("beauty", "tpDiffuse", ...).
    const std::string &name() const { return name_; }

private:
    std::string name_;
};

/// "beauty": the material's full shading.
class NullRenderPass final : public RenderPass {
public:
    explicit NullRenderPass(std::string name = "beauty") : RenderPass(std::move(name)) {}
    Color shade(ShadingContext &ctx, const SurfaceShaderInterface &shader) const override {
        return shader.shade(ctx);
    }
};

/// Shades with a fixed component mask (all components on GI rays when fullOnGIRays is set).
class MaskPass final : public RenderPass {
public:
    MaskPass(std::string name, uint32_t mask, bool fullOnGIRays = false)
        : RenderPass(std::move(name)), mask_(mask), fullOnGIRays_(fullOnGIRays) {}
    /// Black (alpha: the weight's) for mask none, without shading.
    Color shade(ShadingContext &ctx, const SurfaceShaderInterface &shader) const override;
    uint32_t mask() const { return mask_; }

private:
    uint32_t mask_;
    bool fullOnGIRays_;
};

/// The reflections or the refractions of a surface alone: on camera rays only that component
/// is shaded; what the secondary rays meet is shaded in full.
class SecondaryPassOverride final : public RenderPass {
public:
    enum Mode { kReflections, kRefractions };
    SecondaryPassOverride(std::string name, Mode mode, uint32_t depthLimit = 0,
                          uint32_t maxDepth = 10000)
        : RenderPass(std::move(name)), mode_(mode), depthLimit_(depthLimit), maxDepth_(maxDepth) {}
    Color shade(ShadingContext &ctx, const SurfaceShaderInterface &shader) const override;
    Mode mode() const { return mode_; }

private:
    Mode mode_;
    uint32_t depthLimit_, maxDepth_;
};

/// "shadow": the material's shadow answer (grey, 1 = unshadowed).
class ShadowPassOverride final : public RenderPass {
public:
    explicit ShadowPassOverride(std::string name = "shadow") : RenderPass(std::move(name)) {}
    Color shade(ShadingContext &ctx, const SurfaceShaderInterface &shader) const override {
        return shader.shadow(ctx);
    }
};

/// "tpAlbedo": the material's albedo (its diffuse colour under white light of cosine 1).
class AlbedoPass final : public RenderPass {
public:
    explicit AlbedoPass(std::string name = "tpAlbedo") : RenderPass(std::move(name)) {}
    Color shade(ShadingContext &ctx, const SurfaceShaderInterface &shader) const override {
        return shader.albedo(ctx);
    }
};

/// Light arriving at the context's point over its shading normal, cosine-weighted: the sum
/// the diffuse colour multiplies (direct light of every linked light, ambient lights with
/// cosine 1, and the indirect light of the GI integrators). Alpha 1. withShadows: shadowed
/// direct light.
Color gatherIllumination(ShadingContext &ctx, bool withShadows = true);

/// "tpIllumination": the incident light at the point (gatherIllumination), alpha 1. GI rays
/// shade fully; in camera mode camera rays give white.
class IlluminationPass final : public RenderPass {
public:
    explicit IlluminationPass(std::string name = "tpIllumination", bool cameraMode = false)
        : RenderPass(std::move(name)), cameraMode_(cameraMode) {}
    Color shade(ShadingContext &ctx, const SurfaceShaderInterface &shader) const override;

private:
    bool cameraMode_;
};

/// "tpFullandIndirectIllumination": full illumination in output 0, the indirect part alone in
/// output 1 ("WideOutput" layers).
class CombinedIlluminationPass final : public RenderPass {
public:
    explicit CombinedIlluminationPass(std::string name = "tpFullandIndirectIllumination")
        : RenderPass(std::move(name)) {}
    Color shade(ShadingContext &ctx, const SurfaceShaderInterface &shader) const override;
    int outputCount() const override { return 2; }
    std::string outputName(int i) const override {
        return i == 0 ? name() : name() + "WideOutput";
    }
    void shadeAll(ShadingContext &ctx, const SurfaceShaderInterface &shader,
                  Color *out) const override;
};

/// How the radiosity-normal-map pass bakes (the RNMSettings of a texture bake).
struct RnmSettings {
    enum AllowNegative : int32_t { kAllow = 0, kDisallow = 1, kDisallowCullHorizon = 2 };
    enum Basis : int32_t { kUnrealEngine = 0, kUnrealEngineFlipped = 1 };
    enum Components : int32_t { kDirectLight = 0, kIndirectLight = 1, kDirectAndIndirect = 2 };
    bool adjustIntensity = false;
    bool includeNormalComponent = false;
    int32_t allowNegative = kDisallowCullHorizon;
    int32_t basis = kUnrealEngine;
    int32_t components = kDirectLight;
    bool enableLambertianClamp = false;
    float lambertianClamp = 2.0f;
    float cosLobeExponent = 1.0f;
    bool monochrome = false;
};

/// The three tangent-space directions of an RNM basis (z along the normal). The flipped basis
/// mirrors the tangent-space y axis, which swaps the order of the second and third vectors.
void rnmBasis(int32_t basis, Vec3 out[3]);

/// "tpRnm": the light arriving along each of three tangent-space basis directions, in the
/// layers "tpRnm0" .. "tpRnm2" (and "tpRnm3", the light along the normal, when asked).
class RnmPass final : public RenderPass {
public:
    explicit RnmPass(const RnmSettings &settings, std::string name = "tpRnm");
    /// Output 0.
    Color shade(ShadingContext &ctx, const SurfaceShaderInterface &shader) const override;
    int outputCount() const override { return settings_.includeNormalComponent ? 4 : 3; }
    std::string outputName(int i) const override { return name() + std::to_string(i); }
    void shadeAll(ShadingContext &ctx, const SurfaceShaderInterface &shader,
                  Color *out) const override;
    const RnmSettings &settings() const { return settings_; }

private:
    RnmSettings settings_;
    Vec3 basis_[3];
};

/// The world-space shading normal as a colour (0.5 n + 0.5, alpha 1).
class NormalsPass final : public RenderPass {
public:
    explicit NormalsPass(std::string name = "tpNormals") : RenderPass(std::move(name)) {}
    Color shade(ShadingContext &ctx, const SurfaceShaderInterface &shader) const override;
};

/// Distance from a reference point, signed by its reference normal, plus an offset, times a
/// scale, in all four channels; black without a reference point.
class DepthPass final : public RenderPass {
public:
    explicit DepthPass(std::string name = "tpDepth") : RenderPass(std::move(name)) {}
    /// Sets the reference point of the current target (call before its tiles are rendered).
    void setReference(const Vec3 &position, const Vec3 &normal, float offset, float scale);
    void clearReference() { hasReference_ = false; }
    Color shade(ShadingContext &ctx, const SurfaceShaderInterface &shader) const override;

private:
    bool hasReference_ = false;
    Vec3 position_, normal_{0, 0, 1};
    float offset_ = 0.0f, scale_ = 1.0f;
};

/// The pass of one of the standard names ("beauty", "shadow", "color", "specular", "diffuse",
/// "tpDiffuse", "tpSpecular", "tpAmbient", "tpIncandescence", "tpSss", "tpReflections",
/// "tpRefractions", "tpAlbedo"); null for any other name (compared exactly).
std::unique_ptr<RenderPass> createRenderPass(const std::string &name);

/// The passes of a run, made once by name and reused.
class RenderPassSet {
public:
    /// The pass of this name: a cached one, else a standard one (createRenderPass), else the
    /// passes the run's settings make ("tpIllumination", "tpFullandIndirectIllumination",
    /// "tpRnm" with rnm, "tpNormals", "tpDepth"); null for an unknown name.
    RenderPass *find(const std::string &name);
    /// Adds a pass made by the caller, replacing a cached one of the same name.
    RenderPass *add(std::unique_ptr<RenderPass> pass);
    /// The settings of the RNM pass made by find("tpRnm") (set before the first find).
    RnmSettings rnm;
    /// Number of cached passes.
    size_t size() const { return passes_.size(); }

private:
    std::map<std::string, std::unique_ptr<RenderPass>> passes_;
};

}  // namespace ox
