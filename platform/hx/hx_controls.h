#ifndef PLATFORM_HX_HX_CONTROLS_H_
#define PLATFORM_HX_HX_CONTROLS_H_

#include "platform/hx/hx_types.h"

/* The controls that a person sets, for a host that offers them before the effect is loaded. A
   loaded effect declares the same in its parameter records (hx_params.h), which have the texts and
   all other parameters too. Disk ids stand in projects: none may change or be used again. */

typedef struct HX_SliderControl {
  int32_t disk_id;
  double min, max; /* what it takes */
  double default_value;
} HX_SliderControl;

typedef struct HX_PopupControl {
  int32_t disk_id;
  int32_t default_item; /* from 1 */
} HX_PopupControl;

typedef struct HX_CheckboxControl {
  int32_t disk_id;
  int32_t default_value; /* 0 or 1 */
} HX_CheckboxControl;

#ifdef __cplusplus
#define HX_CONTROL inline constexpr
#else
#define HX_CONTROL static const
#endif

HX_CONTROL HX_PopupControl HX_RESULT = {19, 1};
HX_CONTROL HX_SliderControl HX_SMOOTHNESS = {20, 0, 1000, 50}; /* percent */
HX_CONTROL HX_PopupControl HX_METHOD = {28, 4};
HX_CONTROL HX_PopupControl HX_FRAMING = {22, 3};
HX_CONTROL HX_SliderControl HX_MAXIMUM_SCALE = {4, 100, 10000, 150};   /* percent */
HX_CONTROL HX_SliderControl HX_ACTION_SAFE_MARGIN = {3, 0, 100, 0};    /* percent */
HX_CONTROL HX_SliderControl HX_ADDITIONAL_SCALE = {16, 0, 10000, 100}; /* percent */
HX_CONTROL HX_CheckboxControl HX_DETAILED_ANALYSIS = {36, 0};
HX_CONTROL HX_PopupControl HX_ROLLING_SHUTTER_RIPPLE = {37, 1};
HX_CONTROL HX_SliderControl HX_CROP_LESS_SMOOTH_MORE = {23, 0, 100, 50};  /* percent */
HX_CONTROL HX_SliderControl HX_SYNTHESIS_INPUT_RANGE = {38, 0, 999, 0.5}; /* seconds */
HX_CONTROL HX_SliderControl HX_SYNTHESIS_EDGE_FEATHER = {35, 0, 999, 10}; /* pixels */
HX_CONTROL HX_CheckboxControl HX_HIDE_WARNING_BANNER = {26, 0};

/* A parameter for experts, which is declared where the effect's experimental ones are. Pixels of a
   picture 1000 wide; at its default all tracks are trusted alike. */
HX_CONTROL HX_SliderControl HX_TRANSITION_BISQUARE_SIGMA = {285, 1, 10, 5};

/* Index of the first experimental parameter of those that a loaded effect declares; the layer's is
   0. */
HX_CONTROL int32_t HX_FIRST_EXPERIMENTAL = 31;

#undef HX_CONTROL

#endif
