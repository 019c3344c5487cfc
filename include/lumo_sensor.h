// Sensor catalogue: sensor codes from sensor names, model classes from codes.
#pragma once

#include "lumo_types.h"

constexpr int LUMO_UNKNOWN_SENSOR = -999;  // also "no model class"
constexpr int LUMO_MAX_SENSOR_CODE = 186;

// Sensor code (0..186) of the segment's szSensorName, using dfPixelRes for the
// few sensors whose code depends on the pixel size; -999 when no catalogue
// entry matches or psSeg is null.
LUMO_API int GetSensor(EphemerisSeg_t* psSeg);

// Model class (0..6) of a sensor code for the rigorous model; -999 when the
// code is out of range or has no class.
LUMO_API int GetModel(int nSensor);
