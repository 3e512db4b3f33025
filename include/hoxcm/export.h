// Symbol visibility of the hoxcm shared library. The library is built with
// hidden visibility; everything a client may call carries HOXCM_API.
#pragma once

#if defined(HOXCM_BUILDING_LIBRARY)
#define HOXCM_API __attribute__((visibility("default")))
#else
#define HOXCM_API
#endif
