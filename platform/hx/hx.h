#ifndef PLATFORM_HX_HX_H_
#define PLATFORM_HX_HX_H_

/* The whole interface between a host and an effect plug-in. */

#include "platform/hx/hx_controls.h"
#include "platform/hx/hx_effect.h"
#include "platform/hx/hx_exports.h"
#include "platform/hx/hx_params.h"
#include "platform/hx/hx_properties.h"
#include "platform/hx/hx_suites.h"
#include "platform/hx/hx_types.h"
#include "platform/hx/hx_world.h"

#endif
