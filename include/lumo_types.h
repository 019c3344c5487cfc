// Shared types of the lumo library: export macro, model codes, null value.
#pragma once

#if defined(_WIN32)
#if defined(LUMO_BUILDING_LIBRARY)
#define LUMO_API __declspec(dllexport)
#else
#define LUMO_API __declspec(dllimport)
#endif
#else
#define LUMO_API __attribute__((visibility("default")))
#endif

struct ProjInfo_t;

// Model codes of the generic dispatch.
enum LumoModelCode {
    LUMO_CODE_AP = 1,
    LUMO_CODE_SRIT = 2,
    LUMO_CODE_LRS = 3,
    LUMO_CODE_POLY = 4,
    LUMO_CODE_TPS = 5,
    LUMO_CODE_RF = 6,
    LUMO_CODE_RTCS = 7,
    LUMO_CODE_NONE = 8,
    LUMO_CODE_OBJECT_IMAGE_TO_GROUND = 9,
    LUMO_CODE_OBJECT_10 = 10,
    LUMO_CODE_OBJECT_11 = 11,
    LUMO_CODE_OBJECT_12 = 12,
};

// A coordinate, height or standard deviation that is not given.
constexpr double LUMO_NULL_VALUE = -1e20;

// Version of the library, "major.minor.patch".
extern "C" LUMO_API const char* LumoVersion();
