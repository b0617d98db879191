#pragma once

#include <cstdint>
#include <string>

#include "raytrace/ray.h"
#include "render/image_sampler.h"
#include "shading/shading_context.h"

/// The tile loop of a camera render: for every tile the image sampler's samples are traced from
/// the camera, shaded through a pass and filtered into the frame.
namespace ox {

class Camera;
class CompleteGrid;
class Frame;
class RenderIOInterface;
class RenderPass;
class Scene;

/// One pass of a camera render over the pixels [xMin..xMax] x [yMin..yMax] (inclusive).
struct CameraTileRun {
    uint32_t xMin = 0, xMax = 0, yMin = 0, yMax = 0;
    int32_t tileWidth = 32, tileHeight = 32;  ///< FrameSettings tileSize
    int32_t scheme = 0;                       ///< FrameSettings tileScheme
    int32_t threadCount = 1;                  ///< render threads
};

/// What a camera render draws on: the scene, its structure, the camera, the sampler and the
/// shading scene (all read-only while the threads run).
struct CameraTileScene {
    const Scene *scene = nullptr;
    const CompleteGrid *grid = nullptr;
    const Camera *camera = nullptr;
    const ImageSampler *sampler = nullptr;
    const ShadingScene *shading = nullptr;
};

/// Renders pass over run into the colour layer `layer` and the float layer "Z" of frame, and
/// adds the rays traced and the samples taken. False (after one message) when a tile failed;
/// an abort through io stops between tiles and returns true.
bool renderCameraTiles(const CameraTileRun &run, const CameraTileScene &scene,
                       const RenderPass &pass, Frame &frame, const std::string &layer,
                       RenderIOInterface &io, RayCounter &rays, ImageSampler::Counters &samples);

}  // namespace ox
