// Coordinate reference systems (CRS) and coordinate transformations of the
// host, built on PROJ.
//
// A CRS object (nova::ogc::cs::ICRS) is immutable: it keeps its definition as
// text and makes PROJ objects only while an operation runs, so one CRS may be
// used from several threads at once. Every CRS and every transformation is
// created by a factory or a utility function below and disposed of with its
// own Release().
//
// Axis order is always X = easting or longitude, Y = northing or latitude,
// Z = height; angles are in degrees and heights in the unit of the CRS's
// vertical axis (metres unless a compound system was built with another
// unit).
//
// The global elevation model (nova::dem) and the time systems (nova::tsys)
// belong in headers of their own; the elevation model is to report its CRS
// through the ICRS interface declared here.
#pragma once

#include <memory>
#include <string>

#include "nova/projection.h"

namespace nova {
namespace ogc {

namespace cs {

// Datum types of the OGC Coordinate Transformation Services. Only the
// vertical ones are used here: CreateCompoundCS accepts orthometric and
// ellipsoidal heights. CS_VD_None marks a CRS without a vertical axis.
enum DatumType {
    CS_VD_None = 0,
    CS_HD_Other = 1000,
    CS_HD_Classic = 1001,
    CS_HD_Geocentric = 1002,
    CS_VD_Other = 2000,
    CS_VD_Orthometric = 2001,  // heights above mean sea level (EGM96 geoid)
    CS_VD_Ellipsoidal = 2002,  // heights above the ellipsoid
    CS_VD_AltitudeBarometric = 2003,
    CS_VD_Normal = 2004,
    CS_VD_GeoidModelDerived = 2005,
    CS_VD_Depth = 2006,
};

// A unit of length for the vertical axis of a compound system.
class LinearUnit {
  public:
    // Throws nova::ParameterException when dfMetresPerUnit is not a positive,
    // finite number or the name is empty.
    LinearUnit(std::string osName, double dfMetresPerUnit);

    static LinearUnit Metre();
    static LinearUnit Foot();          // international foot, 0.3048 m
    static LinearUnit USSurveyFoot();  // 1200/3937 m

    const std::string& GetName() const { return mosName; }
    double GetMetresPerUnit() const { return mdfMetresPerUnit; }

  private:
    std::string mosName;
    double mdfMetresPerUnit;
};

// Abstract coordinate reference system. Objects come from the factories and
// utility functions of this header and are disposed of with Release(); the
// destructor is not public.
class ICRS {
  public:
    // A new, independent copy (released by the caller).
    virtual ICRS* Clone() const = 0;
    // Disposes of this object.
    virtual void Release() = 0;

    virtual std::string GetName() const = 0;
    // Full definition as WKT2 (2019 edition).
    virtual std::string ExportToWkt() const = 0;
    // The system as a PROJ string; empty when PROJ strings cannot express it.
    // PROJ strings do not name vertical datums: use it for display only.
    virtual std::string ExportToProj4() const = 0;
    // The definition in a form that the utility CreateCRSFromDefinition
    // reads back without loss (WKT2; PROJJSON for the rare systems WKT2
    // cannot express).
    virtual std::string GetDefinition() const = 0;

    // Kind of the horizontal part: geographic (longitude/latitude) or
    // projected (easting/northing). Both are false for geocentric,
    // engineering and purely vertical systems.
    virtual bool IsGeographic() const = 0;
    virtual bool IsProjected() const = 0;
    // True for systems that pair a horizontal CRS with heights (made by
    // CreateCompoundCS, or a compound system read from a definition).
    virtual bool IsCompound() const = 0;
    // CS_VD_Orthometric for heights above the geoid, CS_VD_Ellipsoidal for
    // heights above the ellipsoid (3-D geographic or projected systems),
    // CS_VD_None for 2-D systems.
    virtual DatumType GetVerticalDatumType() const = 0;

  protected:
    virtual ~ICRS() = default;
};

}  // namespace cs

namespace ct {

// Abstract point transformation between two CRS.
class IMathTransform {
  public:
    // Transforms one point. The inputs are taken by value, so the same
    // variables may be passed as input and output. Returns true on success.
    // On failure (point outside the domain, latitude beyond +-90 degrees on
    // a geographic side, non-finite input or result) it returns false and
    // leaves the outputs untouched. Safe to call from
    // several threads; calls on one object are serialised.
    virtual bool TransformPoint(double dfX, double dfY, double dfZ, double& dfOutX, double& dfOutY,
                                double& dfOutZ) const = 0;
    // Disposes of this object.
    virtual void Release() = 0;

  protected:
    virtual ~IMathTransform() = default;
};

}  // namespace ct

// Deleter that disposes of CRS and transformation objects through Release(),
// for std::unique_ptr.
struct Releaser {
    template <typename T>
    void operator()(T* poObject) const {
        if (poObject != nullptr) poObject->Release();
    }
};
using CRSPtr = std::unique_ptr<cs::ICRS, Releaser>;
using MathTransformPtr = std::unique_ptr<ct::IMathTransform, Releaser>;

// Turns projection descriptions into CRS.
class IProjInfoFactory {
  public:
    // A new CRS for the description, or null when it has none (PIXEL) or
    // cannot be expressed (unknown projection).
    virtual cs::ICRS* CreateCRS(const ProjInfo_t& sInfo) const = 0;

  protected:
    virtual ~IProjInfoFactory() = default;
};

// Creates CRS from authority codes.
class ICSAuthorityFactory {
  public:
    // A new CRS from "AUTHORITY:CODE" ("EPSG:32631") or a bare EPSG number
    // ("4326"). Throws nova::ParameterException naming the code when it is
    // malformed or names no CRS.
    virtual cs::ICRS* CreateCRS(const std::string& osCode) const = 0;
    // A new WGS 84 geographic 3-D system (EPSG:4979): longitude and latitude
    // in degrees, ellipsoidal height in metres.
    virtual cs::ICRS* CreateWGS84Ellipsoidal() const = 0;

  protected:
    virtual ~ICSAuthorityFactory() = default;
};

// Engine type of the PROJ-based factories, the only one there is.
constexpr int kProjectionEngineProj = 3;

class ProjectionEngine {
  public:
    // The factories of an engine type; null for any type but
    // kProjectionEngineProj. The factories live as long as the process and
    // are never released by the caller.
    static const IProjInfoFactory* GetProjInfoFactory(int nType);
    static const ICSAuthorityFactory* GetCSAuthorityFactory(int nType);
};

namespace utils {

using cs::DatumType;

// A new CRS for a projection description, or null (see IProjInfoFactory).
cs::ICRS* ProjInfoToCRS(const ProjInfo_t& sInfo);

// A new CRS from any definition PROJ reads: WKT, PROJJSON, a PROJ string with
// +type=crs, or "AUTHORITY:CODE". Throws nova::ParameterException when the
// text is not a CRS.
cs::ICRS* CreateCRSFromDefinition(const std::string& osDefinition);

// A new system of the horizontal part of poHorizontal plus heights of the
// given datum type: CS_VD_Orthometric (EGM96 heights above mean sea level) or
// CS_VD_Ellipsoidal. Heights are in metres, or in the given unit. The
// horizontal system is not consumed; if it already has heights, only its
// horizontal part is used. Throws nova::ParameterException for a null or
// non-horizontal system and for other datum types.
cs::ICRS* CreateCompoundCS(const cs::ICRS* poHorizontal, DatumType eVertical);
cs::ICRS* CreateCompoundCS(const cs::ICRS* poHorizontal, DatumType eVertical,
                           const cs::LinearUnit& oHeightUnit);

// A new transformation from poFrom to poTo, or null when either is null or
// the two cannot be related. Heights above the geoid are converted only
// through the geoid model: when that model is not installed, the result is
// null rather than a transformation that leaves heights unchanged.
// dfAccuracy (metres) is the coarsest operation accepted; 0 accepts any.
ct::IMathTransform* CreateCRSTransform(const cs::ICRS* poFrom, const cs::ICRS* poTo,
                                       double dfAccuracy);

}  // namespace utils
}  // namespace ogc
}  // namespace nova
