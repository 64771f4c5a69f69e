#ifndef PLATFORM_HX_HX_EXPORTS_H_
#define PLATFORM_HX_HX_EXPORTS_H_

#include "platform/hx/hx_types.h"

/* What a renderer outside the plug-in calls, from any thread. `block` is the effect's opaque data
   (HX_OpaqueEffectDataSuite1), or null; it must not be released during the call. */

/* One frame's warp: where each vertex of a grid that is laid over the source lands in the steadied
   output. Vertices are row-major, x then y: vertex (c, r) at values[2 * (r * columns + c)], resting
   at (c * (width - 1) / (columns - 1), r * (height - 1) / (rows - 1)) of the source. In pixels of
   the analysed frame, whose pixels are square, before any crop and scale. Never written once it is
   handed out. */
typedef struct HX_VarVector {
  const double* values; /* 2 * columns * rows of them */
  const double* reserved[2];
  int32_t columns, rows;
} HX_VarVector;

/* Whether what is solved fits the controls, and drawing by it alone gives the effect's picture. */
typedef uint8_t (*HX_AllowCUDARendering)(const void* block);
/* The frame's warp, to be rendered from at once; null without one. Frames (fields, where the layer
 * is interlaced) are counted from the first analysed one: the layer's frame + the layer's in-point
 * in source frames - first_frame (HX_GetStabilizerData). One outside the warps throws. The address
 * holds until the same thread asks again or ends, whatever is solved meanwhile; asking with a null
 * block lets go of it. A thread that has asked once keeps the library from being unloaded until it
 * ends. */
typedef const HX_VarVector* (*HX_GetOVVarVector)(const void* block, int32_t frame);
/* The frame's window, right and bottom included, in pixels of the analysed frame from the bounds'
 * minimum (HX_GetStabilizerData); the outs stand unchanged without a crop. Frames are counted as
 * above, and must be among the warps. */
typedef void (*HX_GetCropWindow)(const void* block, int32_t frame, float* left, float* top,
                                 float* right, float* bottom);
/* False without a solve; then the outs stand unchanged. The crop's size stands unchanged without a
 * crop. first_frame: the first analysed one, counted in the source. min_x to max_y: what all
 * frames' warps cover together. The source's size is in the layer's own pixels. */
typedef uint8_t (*HX_GetStabilizerData)(const void* block, int32_t* frame_count,
                                        int32_t* first_frame, int32_t* grid_columns,
                                        int32_t* grid_rows, int32_t* crop_width,
                                        int32_t* crop_height, float* min_x, float* min_y,
                                        float* max_x, float* max_y, int32_t* source_width,
                                        int32_t* source_height);

#define HX_EXPORT_ALLOW_CUDA_RENDERING "allowCUDARendering"
#define HX_EXPORT_GET_VAR_VECTOR "getOVVarVector"
#define HX_EXPORT_GET_CROP_WINDOW "getCropWindow"
#define HX_EXPORT_GET_STABILIZER_DATA "getStabilizerData"
/* Data: rows of three uint32_t, for HX_UTILITY_BEGIN_RENDER. */
#define HX_EXPORT_FCD_TABLE "HXp_G_fcd_table"

HX_STATIC_ASSERT(sizeof(void*) != 8 || sizeof(HX_VarVector) == 32, "HX_VarVector");

#endif
