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

// ---------------------------------------------------------------------------
// Ephemeris segment: a satellite's orbit and scene metadata, filled by the
// host and read by the rigorous, radar and low-resolution orbit models.
// Texts are NUL-terminated arrays; angles are radians unless stated.
// Fields marked "carried" are never interpreted by the library but are copied.
// ---------------------------------------------------------------------------
#include <cstdint>

// Kinds of orbit sub-record held by EphemerisSeg_t::ppOrbitData.
enum EphemerisOrbitType {
    EPH_ORBIT_NONE = 0,
    EPH_ORBIT_ATTITUDE = 1,  // AttitudeData_t
    EPH_ORBIT_RADAR = 2,     // RadarData_t
    EPH_ORBIT_AVHRR = 3,     // AvhrrData_t
};

// One image line of the attitude table: ground offsets of the line.
struct AttitudeLine_t {
    double dfValue1;  // along-track ground offset
    double dfValue2;  // across-track ground offset
};

// Orbit sub-record of kind 1.
struct AttitudeData_t {
    double dfAttitude1;
    double dfAttitude2;
    double dfAttitude3;
    int32_t nNumAttitudeLines;
    AttitudeLine_t* pAttitudeLines;  // nNumAttitudeLines elements or null
};

// One image line of a radar scene: slant ranges of the first and last pixel,
// latitude and longitude (degrees) of the first, middle and last pixel.
struct RadarLine_t {
    int32_t nRangeFirst;
    int32_t nRangeLast;
    float fLatFirst;
    float fLatMid;
    float fLatLast;
    float fLonFirst;
    float fLonMid;
    float fLonLast;
};

constexpr int RADAR_LEADING_SIZE = 108;

// Orbit sub-record of kind 2.
struct RadarData_t {
    uint8_t abyLeading[RADAR_LEADING_SIZE];  // carried
    int32_t nNumLinePositions;
    RadarLine_t* pLinePositions;  // nNumLinePositions elements or null
};

constexpr int AVHRR_LINE_SIZE = 80;
constexpr int AVHRR_TIME_CODE_SIZE = 7;

// One AVHRR scan line, 80 bytes.
struct AvhrrLine_t {
    int32_t nCarried;
    int32_t nTimeMs;  // time of the line, milliseconds of the day (GMT)
    uint8_t abyCarriedA[20];
    // day of year hundreds, day of year remainder (0-99), hour, minute,
    // second, hundredths and ten-thousandths of a second
    uint8_t abyTimeCode[AVHRR_TIME_CODE_SIZE];
    uint8_t abyCarriedB[AVHRR_LINE_SIZE - 8 - 20 - AVHRR_TIME_CODE_SIZE];
};
static_assert(sizeof(AvhrrLine_t) == AVHRR_LINE_SIZE, "an AVHRR scan line is 80 bytes");

constexpr int AVHRR_LEADING_SIZE = 64;
constexpr int AVHRR_FIELD_SIZE = 17;  // 16 characters and the terminator

// Orbit sub-record of kind 3: the scene's orbit header as 26 text fields.
struct AvhrrData_t {
    uint8_t abyLeading[AVHRR_LEADING_SIZE];  // carried
    int32_t nTimeDirection;  // non-zero when scan-line times decrease along the image
    char szField1[AVHRR_FIELD_SIZE];
    char szField2[AVHRR_FIELD_SIZE];
    char szEpochYearDay[AVHRR_FIELD_SIZE];  // field 3
    char szEpochMsOfDay[AVHRR_FIELD_SIZE];  // field 4
    char szClockOffset[AVHRR_FIELD_SIZE];   // field 5
    char szField6[AVHRR_FIELD_SIZE];
    char szField7[AVHRR_FIELD_SIZE];
    char szField8[AVHRR_FIELD_SIZE];
    char szField9[AVHRR_FIELD_SIZE];
    char szField10[AVHRR_FIELD_SIZE];
    char szField11[AVHRR_FIELD_SIZE];
    char szField12[AVHRR_FIELD_SIZE];
    char szField13[AVHRR_FIELD_SIZE];
    char szEpochHour[AVHRR_FIELD_SIZE];         // field 14
    char szEpochMinute[AVHRR_FIELD_SIZE];       // field 15
    char szEpochMillisecond[AVHRR_FIELD_SIZE];  // field 16
    char szGreenwichAngle[AVHRR_FIELD_SIZE];    // field 17
    char szField18[AVHRR_FIELD_SIZE];
    char szField19[AVHRR_FIELD_SIZE];
    char szEccentricity[AVHRR_FIELD_SIZE];      // field 20
    char szPerigeeArgument[AVHRR_FIELD_SIZE];   // field 21
    char szAscNodeLongitude[AVHRR_FIELD_SIZE];  // field 22
    char szInclination[AVHRR_FIELD_SIZE];       // field 23
    char szMeanAnomaly[AVHRR_FIELD_SIZE];       // field 24
    char szSemiMajorAxis[AVHRR_FIELD_SIZE];     // field 25
    char szField26[AVHRR_FIELD_SIZE];
    int32_t nNumScanLines;
    AvhrrLine_t* pScanLines;  // nNumScanLines elements or null
};

constexpr int EPH_HEADER_TEXT_SIZE = 33;
constexpr int EPH_SENSOR_NAME_SIZE = 17;
constexpr int EPH_SENSOR_EXTRA_SIZE = 3;
constexpr int EPH_DATE_SIZE = 28;
constexpr int EPH_GEOSYS_SIZE = 16;
constexpr int EPH_CARRIED_A_COUNT = 30;
constexpr int EPH_CARRIED_B_COUNT = 4;
constexpr int EPH_LEVEL_PARAM_COUNT = 4;
constexpr int EPH_LEVEL_COEF_COUNT = 39;

// The ephemeris segment. The main record, the holder, the sub-record and its
// line array are four heap blocks (host allocator, released with free) owned
// by whoever holds the main record.
struct EphemerisSeg_t {
    char szHeaderText1[EPH_HEADER_TEXT_SIZE];   // carried
    char szHeaderText2[EPH_HEADER_TEXT_SIZE];   // carried
    char szSensorName[EPH_SENSOR_NAME_SIZE];    // e.g. "SPOT5_PAN_5"
    char szSensorExtra[EPH_SENSOR_EXTRA_SIZE];  // carried
    char szAcquisitionDate[EPH_DATE_SIZE];      // year 0-3, month 5-6, day 8-9
    int32_t nSupplementFlag;                    // non-zero: constrain the rigorous adjustment
    double dfIFOV;                              // angle subtended by one pixel
    double dfViewAngle;                         // across-track viewing angle
    double dfCentreColumn;                      // image column of the scene centre
    double dfCentreLine;                        // image line of the scene centre
    double dfSatVelocity;                       // metres per second
    double dfAngularSpeed;                      // radians per second
    double dfOrbitSpare1;                       // carried
    double dfSatHeight;                         // metres above the scene
    double dfInclination;
    double dfLineInterval;  // seconds between two image lines
    double dfAscNodeLongitude;
    double dfPerigeeArgument;
    double dfOrbitSpare2;                     // carried
    double dfCentreLatitude;                  // geodetic latitude of the scene centre
    double dfOrbitRadius;                     // metres from the Earth's centre
    double dfPitchAngle;                      // along-track viewing angle
    double dfOrbitSpare3;                     // carried
    double dfOrbitSpare4;                     // carried
    char szGeosys[EPH_GEOSYS_SIZE];           // georeferencing text of the scene
    uint8_t bCarriedFlag;                     // carried
    double dfPixelRes;                        // pixel size on the ground, metres
    double dfLineRes;                         // line spacing on the ground, metres
    int32_t nCarried1;                        // carried
    double adfCarriedA[EPH_CARRIED_A_COUNT];  // carried
    double dfAvgHeight;                       // average terrain height, metres
    double adfCarriedB[EPH_CARRIED_B_COUNT];  // carried
    int32_t nLevelConvForm;                   // 20 or 39 terms of level 1A/1B conversion; 0 none
    int32_t anLevelConvParams[EPH_LEVEL_PARAM_COUNT];  // image offsets
    double adfLevelConvCoefs[EPH_LEVEL_COEF_COUNT];
    int32_t nBytesPerRecord;
    int32_t nNumLines;
    int32_t nBytesPerPixel;
    int32_t nNumPixels;
    int32_t nPrefixBytes;
    int32_t nSuffixBytes;
    int32_t nCarried2;   // carried
    int32_t nOrbitType;  // an EphemerisOrbitType; other values have no sub-record
    // Null, or a block holding exactly one pointer to the sub-record of kind
    // nOrbitType.
    void** ppOrbitData;
};

// ---------------------------------------------------------------------------
// Ground control point: image position and ground position. Control points
// travel as std::vector<ControlPoint_t>.
// ---------------------------------------------------------------------------
struct ControlPoint_t {
    double dfImageX;   // pixel (column)
    double dfImageY;   // line (row)
    double dfGroundX;  // easting, or longitude in degrees
    double dfGroundY;  // northing, or latitude in degrees
    double dfGroundZ;  // height, metres
};
