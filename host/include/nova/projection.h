// Projection descriptions, georeferencing texts, ellipsoids and point
// reprojection. The grammar of georeferencing texts is in
// docs/georeferencing.md.
#pragma once

#include <string>

// Numeric projection kinds returned by DecodeGeosys. Geographic is 3.
enum NovaProjKind {
    NOVA_PROJ_UNKNOWN = -1,
    NOVA_PROJ_PIXEL = 0,
    NOVA_PROJ_METRE = 1,
    NOVA_PROJ_UTM = 2,
    NOVA_PROJ_GEOGRAPHIC = 3,
    NOVA_PROJ_TM = 4,
    NOVA_PROJ_LCC = 5,
    NOVA_PROJ_PS = 6,
    NOVA_PROJ_MER = 7,
    // A projected system given by its EPSG code whose projection has no
    // keyword of its own (Lambert azimuthal equal-area, oblique Mercator...).
    NOVA_PROJ_OTHER = 8,
};

// Earth-model kinds (nEarthModelKind).
enum NovaEarthModelKind {
    NOVA_EARTH_DEFAULT = 0,         // none given: WGS 84
    NOVA_EARTH_DATUM = 1,           // Dnnn: datum table
    NOVA_EARTH_ELLIPSOID = 2,       // Ennn given in the text
    NOVA_EARTH_SPHEROID_PARMS = 3,  // spheroid code and adfProjParms[0..1]
};

constexpr int NOVA_GEOSYS_LEN = 64;
constexpr int NOVA_PROJ_PARMS = 15;

// A plain record: zero-filled, copied by value, released with free().
struct ProjInfo_t {
    char szProj[NOVA_GEOSYS_LEN];  // normalised georeferencing text, terminated
    // Projection parameters in the General Cartographic Transformation Package
    // convention: [0] semi-major axis (0: from the spheroid code), [1]
    // semi-minor axis, squared eccentricity or 0, then per projection.
    double adfProjParms[NOVA_PROJ_PARMS];
    // Affine georeferencing: X = x * dfXScale + dfXOffset, Y likewise.
    double dfXOffset;
    double dfYOffset;
    double dfXScale;
    double dfYScale;
    int nSpheroid;        // spheroid code 0..19, or -1 when not set
    int nEarthModelKind;  // NovaEarthModelKind
    // Host-only fields.
    int nProjKind;  // NovaProjKind
    int nZone;      // UTM zone 1..60, negative for the southern hemisphere
    int nDatum;     // index into the datum table when the earth model is Dnnn, else -1
};

// Resets a description. nMode 0: empty text; nMode 1: "PIXEL".
void InitProjInfo(ProjInfo_t* psInfo, int nMode);
// Fills a description from a georeferencing text; the four numbers are the
// affine offsets and scales (x offset, y offset, x scale, y scale). Returns 0
// on success, a negative value on failure (unknown or malformed text).
int Geosys2ProjInfo(ProjInfo_t* psInfo, const char* pszGeosys, double dfXOffset, double dfYOffset,
                    double dfXScale, double dfYScale);
// Fills a description from a bare unit keyword ("PIXEL", "METRE"). 0 / -1.
int ProjStringToProjInfo(const char* pszProj, ProjInfo_t* psInfo);
// Parameter text of a description (malloc'ed, caller frees, at most 255
// characters); ProjParms2Info applies such a text (returns 0 / -1).
char* ProjInfo2Parms(const ProjInfo_t* psInfo);
int ProjParms2Info(const char* pszParms, ProjInfo_t* psInfo);
// Why a georeferencing text is refused, in a sentence a user can act on;
// empty when Geosys2ProjInfo accepts it.
std::string ExplainGeosys(const char* pszGeosys);
// Normalises a georeferencing text into pszOut (at least 20 characters; may
// be null or the same buffer as pszGeosys) and returns its NovaProjKind, or
// NOVA_PROJ_UNKNOWN (pszOut then holds an empty text).
int DecodeGeosys(const char* pszGeosys, char* pszOut);
// Non-zero for kinds that need adfProjParms beyond their text (TM, LCC, PS,
// MER; for an EPSG code of these kinds Geosys2ProjInfo fills them).
int RequiresProjInfo(int nKind);
// 1 for projected, conformal ground units (UTM, TM, LCC, PS, MER, METRE, and
// EPSG codes of conformal projections).
int IsConformal(const char* pszGeosys);
// Reprojects one point (ground coordinates: the affine georeferencing is not
// applied; X is easting or longitude, Y northing or latitude, in degrees for
// geographic descriptions). Returns 0 on success, non-zero on failure (null
// arguments, PIXEL or METRE against a ground system, bad parameters, NaN
// input, latitude beyond +-90, a point PROJ cannot transform); on failure
// *pdfX and *pdfY are left unchanged. Transformations are cached per thread.
int GCTPTransform(const ProjInfo_t* psFrom, double dfX, double dfY, const ProjInfo_t* psTo,
                  double* pdfX, double* pdfY);
int GCTPSimpleTransform(char* pszFrom, double dfX, double dfY, char* pszTo, double* pdfX,
                        double* pdfY);
// UTM zone (1..60) of a geographic point (dfLon, dfLat in degrees) and its
// latitude band letter (C..X, 'Z' outside the bands) in *pcRow when not null.
// Returns 0, or -1 (zone 0) for invalid coordinates.
int UTMZone(double dfLon, double dfLat, int* pnZone, char* pcRow);
// Ground points (X, Y) of a UTM description whose text names a latitude band
// ("UTM 21 S") checked against that band: advice for the user when their mean
// position lies more than one band (8 degrees of latitude) outside it, saying
// what the letter means and how to write the zone in the other hemisphere;
// empty otherwise (and for other descriptions or no finite point).
std::string CheckUTMBand(const ProjInfo_t* psInfo, const double* padfX, const double* padfY,
                         int nCount);
// Earth-model code of a description ("D000", "E012") into pszOut (>= 16 chars).
int GetEarthModel(const ProjInfo_t* psInfo, char* pszOut);

// Ellipsoid of a georeferencing text or bare earth-model code ("E012",
// "D000", "UTM 31 D000"): its spheroid code, semi-major and semi-minor axes.
bool GetEllipsoidData(const char* pszCode, int* pnIndex, double* pdfSemiMajor,
                      double* pdfSemiMinor);

// Angles in GCTP's packed form DDDMMMSSS.SS (sign applies to the whole value:
// 45 deg 30 min 15.5 s is 45030015.5, -3 deg is -3000000). Returns 0, or -1
// (degrees untouched) for a non-finite value or minutes / seconds >= 60.
int PackedDMSToDegrees(double dfPacked, double* pdfDegrees);
// Decimal degrees to packed DMS (seconds rounded to 1e-7, carried into the
// minutes and degrees). Non-finite input is returned unchanged.
double DegreesToPackedDMS(double dfDegrees);

class EllipsoidInfoList {
  public:
    // "Ennn" of the listed ellipsoid with these axes (to 1 mm), or "".
    static std::string GetEllipsoidCode(double dfSemiMajor, double dfSemiMinor);
};
