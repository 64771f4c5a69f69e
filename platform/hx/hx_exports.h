#ifndef PLATFORM_HX_HX_EXPORTS_H_
#define PLATFORM_HX_HX_EXPORTS_H_

#include "platform/hx/hx_types.h"

/* What a renderer outside the plug-in calls, from any thread. `block` is the effect's opaque data
   (HX_OpaqueEffectDataSuite1), or null; it must not be released during the call. */

typedef uint8_t (*HX_AllowCUDARendering)(const void* block);
/* Address of the frame's warp, to be rendered from at once; null without one. A frame outside the
 * warps throws. */
typedef const void* (*HX_GetOVVarVector)(const void* block, int32_t frame);
/* In pixels of the source; the outs stand unchanged without a crop. The frame must be one of the
 * analysed range. */
typedef void (*HX_GetCropWindow)(const void* block, int32_t frame, float* left, float* top,
                                 float* right, float* bottom);
/* False without a solve; then the outs stand unchanged. The crop's size stands unchanged without a
 * crop. */
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

#endif
