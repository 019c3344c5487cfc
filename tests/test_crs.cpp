// Coordinate reference systems and transformations: geoid heights, compound
// systems, factories, failure paths and concurrent use.

#include <gtest/gtest.h>

#include <cmath>
#include <limits>
#include <string>
#include <thread>
#include <vector>

#include "crs.h"
#include "projection.h"
#include "runtime.h"

namespace {

using nova::ogc::CRSPtr;
using nova::ogc::MathTransformPtr;
using nova::ogc::cs::CS_VD_Ellipsoidal;
using nova::ogc::cs::CS_VD_None;
using nova::ogc::cs::CS_VD_Orthometric;
using nova::ogc::cs::LinearUnit;
namespace utils = nova::ogc::utils;

constexpr const char* kLocalEngineering =
    "ENGCRS[\"Local grid\",EDATUM[\"Site\"],CS[Cartesian,2],"
    "AXIS[\"x\",east,LENGTHUNIT[\"metre\",1]],AXIS[\"y\",north,LENGTHUNIT[\"metre\",1]]]";

ProjInfo_t Info(const char* pszGeosys) {
    ProjInfo_t sInfo{};
    EXPECT_GE(Geosys2ProjInfo(&sInfo, pszGeosys, 0.0, 0.0, 1.0, 1.0), 0) << pszGeosys;
    return sInfo;
}

CRSPtr CRSFromGeosys(const char* pszGeosys) {
    return CRSPtr(nova::ogc::ProjectionEngine::GetProjInfoFactory(3)->CreateCRS(Info(pszGeosys)));
}

CRSPtr WGS84Ellipsoidal() {
    return CRSPtr(nova::ogc::ProjectionEngine::GetCSAuthorityFactory(3)->CreateWGS84Ellipsoidal());
}

CRSPtr Compound(const CRSPtr& poHorizontal, nova::ogc::cs::DatumType eVertical) {
    return CRSPtr(utils::CreateCompoundCS(poHorizontal.get(), eVertical));
}

MathTransformPtr Transform(const CRSPtr& poFrom, const CRSPtr& poTo) {
    return MathTransformPtr(utils::CreateCRSTransform(poFrom.get(), poTo.get(), 0.0));
}

struct Point {
    double dfX, dfY, dfZ;
};

Point Apply(const MathTransformPtr& poTransform, Point sIn) {
    Point sOut{std::nan(""), std::nan(""), std::nan("")};
    if (!poTransform) {
        ADD_FAILURE() << "no transformation";
        return sOut;
    }
    EXPECT_TRUE(
        poTransform->TransformPoint(sIn.dfX, sIn.dfY, sIn.dfZ, sOut.dfX, sOut.dfY, sOut.dfZ))
        << sIn.dfX << " " << sIn.dfY << " " << sIn.dfZ;
    return sOut;
}

// Height above the ellipsoid of a point at mean sea level: the geoid
// undulation.
double Undulation(const MathTransformPtr& poToEllipsoidal, double dfLon, double dfLat) {
    const Point sOut = Apply(poToEllipsoidal, {dfLon, dfLat, 0.0});
    EXPECT_NEAR(sOut.dfX, dfLon, 1e-9);
    EXPECT_NEAR(sOut.dfY, dfLat, 1e-9);
    return sOut.dfZ;
}

TEST(CRS, GeoidUndulationsMatchPublishedValues) {
    CRSPtr poLonLat = CRSFromGeosys("LONG/LAT D000");
    ASSERT_TRUE(poLonLat);
    MathTransformPtr poTransform =
        Transform(Compound(poLonLat, CS_VD_Orthometric), WGS84Ellipsoidal());
    ASSERT_TRUE(poTransform);

    // Test values distributed with the EGM96 model (NGA), computed from the
    // full spherical-harmonic expansion: latitude, longitude, undulation.
    const struct {
        double dfLat, dfLon, dfN;
    } asPublished[] = {
        {38.6281550, 269.7791550 - 360.0, -31.628}, {-14.6212170, 305.0211140 - 360.0, -2.969},
        {46.8743190, 102.4487290, -43.575},         {-23.6174460, 133.8747120, 15.871},
        {38.6254730, 359.9995000 - 360.0, 50.066},  {-0.4667440, 0.0023000, 17.329},
    };
    for (const auto& s : asPublished) {
        EXPECT_NEAR(Undulation(poTransform, s.dfLon, s.dfLat), s.dfN, 0.5)
            << s.dfLat << " " << s.dfLon;
    }
}

TEST(CRS, UtmOrthometricRoundTripThroughWgs84AndHeightUnits) {
    CRSPtr poUtm = CRSFromGeosys("UTM 31 D000");
    ASSERT_TRUE(poUtm);
    CRSPtr poUtmMsl = Compound(poUtm, CS_VD_Orthometric);
    CRSPtr poWgs84 = WGS84Ellipsoidal();
    MathTransformPtr poForward = Transform(poUtmMsl, poWgs84);
    MathTransformPtr poBackward = Transform(poWgs84, poUtmMsl);
    ASSERT_TRUE(poForward && poBackward);

    // On the central meridian the easting is the false easting exactly.
    const Point sCentral = Apply(poForward, {500000.0, 5760000.0, 0.0});
    EXPECT_NEAR(sCentral.dfX, 3.0, 1e-12);
    EXPECT_NEAR(sCentral.dfY, 51.990665, 1e-6);
    EXPECT_NEAR(sCentral.dfZ, 44.0675, 0.5);  // cs2cs EPSG:32631+5773 -> EPSG:4979

    // Heights in feet: only the height axis changes unit.
    CRSPtr poFeetMsl(utils::CreateCompoundCS(poUtm.get(), CS_VD_Orthometric, LinearUnit::Foot()));
    EXPECT_NE(poFeetMsl->GetName().find("foot"), std::string::npos) << poFeetMsl->GetName();
    const Point sFeet = Apply(Transform(poFeetMsl, poWgs84), {500000.0, 5760000.0, 100.0});
    EXPECT_NEAR(sFeet.dfX, 3.0, 1e-12);
    EXPECT_NEAR(sFeet.dfZ, sCentral.dfZ + 30.48, 1e-6);
    const CRSPtr poSurveyFeet(
        utils::CreateCompoundCS(poUtm.get(), CS_VD_Ellipsoidal, LinearUnit::USSurveyFoot()));
    const Point sSurvey = Apply(Transform(poSurveyFeet, poWgs84), {500000.0, 5760000.0, 100.0});
    EXPECT_NEAR(sSurvey.dfY, sCentral.dfY, 1e-9);
    EXPECT_NEAR(sSurvey.dfZ, 100.0 * 1200.0 / 3937.0, 1e-9);
    for (double dfBad : {0.0, -1.0, std::nan(""), std::numeric_limits<double>::infinity()}) {
        EXPECT_THROW(LinearUnit("rod", dfBad), nova::ParameterException) << dfBad;
    }
    EXPECT_THROW(LinearUnit("", 1.0), nova::ParameterException);

    // Independent horizontal path: the projection service's own reprojection;
    // heights gain the undulation there and come back.
    const ProjInfo_t sUtm = Info("UTM 31 D000");
    const ProjInfo_t sLonLat = Info("LONG/LAT D000");
    CRSPtr poLonLatMsl = Compound(CRSFromGeosys("LONG/LAT D000"), CS_VD_Orthometric);
    MathTransformPtr poGeoid = Transform(poLonLatMsl, poWgs84);
    for (double dfEasting = 300000.0; dfEasting <= 700000.0; dfEasting += 100000.0) {
        for (double dfNorthing = 4000000.0; dfNorthing <= 7000000.0; dfNorthing += 750000.0) {
            const Point sIn{dfEasting, dfNorthing, 123.25};
            const Point sGeo = Apply(poForward, sIn);
            double dfLon = 0.0, dfLat = 0.0;
            ASSERT_EQ(GCTPTransform(&sUtm, dfEasting, dfNorthing, &sLonLat, &dfLon, &dfLat), 0);
            EXPECT_NEAR(sGeo.dfX, dfLon, 1e-8);
            EXPECT_NEAR(sGeo.dfY, dfLat, 1e-8);
            EXPECT_NEAR(sGeo.dfZ, 123.25 + Undulation(poGeoid, dfLon, dfLat), 1e-6);
            const Point sBack = Apply(poBackward, sGeo);
            EXPECT_NEAR(sBack.dfX, sIn.dfX, 1e-5);
            EXPECT_NEAR(sBack.dfY, sIn.dfY, 1e-5);
            EXPECT_NEAR(sBack.dfZ, sIn.dfZ, 1e-6);
        }
    }

    // Southern zones: false northing 10 000 km, central meridian 15E.
    const Point sSouth =
        Apply(Transform(Compound(CRSFromGeosys("UTM 33 C D000"), CS_VD_Orthometric), poWgs84),
              {500000.0, 9000000.0, 0.0});
    EXPECT_NEAR(sSouth.dfX, 15.0, 1e-12);
    EXPECT_NEAR(sSouth.dfY, -9.0, 0.1);
    EXPECT_NEAR(sSouth.dfZ, Undulation(poGeoid, sSouth.dfX, sSouth.dfY), 1e-6);
}

TEST(CRS, KindsOfSystemsClonesAndRelease) {
    CRSPtr poUtm = CRSFromGeosys("UTM 31 D000");
    CRSPtr poLonLat = CRSFromGeosys("LONG/LAT D000");
    ASSERT_TRUE(poUtm && poLonLat);
    EXPECT_TRUE(poUtm->IsProjected() && !poUtm->IsGeographic() && !poUtm->IsCompound());
    EXPECT_EQ(poUtm->GetVerticalDatumType(), CS_VD_None);
    EXPECT_TRUE(poLonLat->IsGeographic() && !poLonLat->IsProjected());
    CRSPtr poEll = Compound(poLonLat, CS_VD_Ellipsoidal);
    EXPECT_TRUE(poEll->IsCompound() && poEll->IsGeographic());
    EXPECT_EQ(poEll->GetVerticalDatumType(), CS_VD_Ellipsoidal);

    // A system that already has heights contributes its horizontal part.
    CRSPtr poMsl = Compound(poUtm, CS_VD_Orthometric);
    CRSPtr poRebuilt = Compound(poMsl, CS_VD_Ellipsoidal);
    EXPECT_TRUE(poRebuilt->IsProjected());
    EXPECT_EQ(poRebuilt->GetVerticalDatumType(), CS_VD_Ellipsoidal);
    EXPECT_EQ(poRebuilt->GetName(), poUtm->GetName());

    // Definitions read back to the same system.
    CRSPtr poCopy(utils::CreateCRSFromDefinition(poMsl->GetDefinition()));
    EXPECT_EQ(poCopy->ExportToWkt(), poMsl->ExportToWkt());
    EXPECT_EQ(poCopy->GetVerticalDatumType(), CS_VD_Orthometric);
    CRSPtr poByNumber(nova::ogc::ProjectionEngine::GetCSAuthorityFactory(3)->CreateCRS("32631"));
    EXPECT_EQ(poByNumber->ExportToWkt(), poUtm->ExportToWkt());

    // A clone lives on after the original is gone, and so does a
    // transformation after both its systems are released.
    nova::ogc::cs::ICRS* poRaw = utils::CreateCompoundCS(poUtm.get(), CS_VD_Orthometric);
    CRSPtr poClone(poRaw->Clone());
    ASSERT_NE(poClone.get(), poRaw);
    EXPECT_EQ(poClone->ExportToWkt(), poRaw->ExportToWkt());
    poRaw->Release();
    EXPECT_TRUE(poUtm->IsProjected());  // the horizontal system stays with its owner
    CRSPtr poWgs84 = WGS84Ellipsoidal();
    MathTransformPtr poTransform = Transform(poClone, poWgs84);
    ASSERT_TRUE(poTransform);
    poClone.reset();
    poWgs84.reset();
    EXPECT_NEAR(Apply(poTransform, {500000.0, 5760000.0, 0.0}).dfZ, 44.0675, 0.5);
}

// Only the PROJ engine has factories. That planes have no system is seen
// where it matters: the model object and the control point conversion
// refuse them.
TEST(CRS, FactoriesExistOnlyForTheProjEngine) {
    EXPECT_NE(nova::ogc::ProjectionEngine::GetProjInfoFactory(3), nullptr);
    EXPECT_EQ(nova::ogc::ProjectionEngine::GetProjInfoFactory(1), nullptr);
    EXPECT_EQ(nova::ogc::ProjectionEngine::GetCSAuthorityFactory(0), nullptr);
    EXPECT_EQ(nova::ogc::ProjectionEngine::GetCSAuthorityFactory(4), nullptr);
}

// Expects a nova::ParameterException naming the parameter and quoting the
// offending value.
template <typename F>
void ExpectParameterError(F fnCall, const std::string& osName, const std::string& osValue) {
    try {
        fnCall();
        ADD_FAILURE() << "no exception for " << osValue;
    } catch (const nova::ParameterException& e) {
        EXPECT_EQ(e.GetParameterName(), osName);
        EXPECT_NE(std::string(e.what()).find(osValue), std::string::npos) << e.what();
    }
}

TEST(CRS, BadInputIsReported) {
    const auto* poAuthority = nova::ogc::ProjectionEngine::GetCSAuthorityFactory(3);
    for (const char* pszCode : {"EPSG:99999999", "garbage", "EPSG:", ":4326", "EPSG:6326", ""}) {
        ExpectParameterError([&] { poAuthority->CreateCRS(pszCode); }, "osCode", pszCode);
    }
    for (const char* pszText : {"+proj=utm +zone=31", "no such thing", ""}) {
        ExpectParameterError([&] { utils::CreateCRSFromDefinition(pszText); }, "osDefinition",
                             pszText);
    }

    // A local engineering grid has no relation to the earth.
    CRSPtr poUtm = CRSFromGeosys("UTM 31 D000");
    CRSPtr poLocal(utils::CreateCRSFromDefinition(kLocalEngineering));
    CRSPtr poWgs84 = WGS84Ellipsoidal();
    EXPECT_FALSE(poLocal->IsGeographic() || poLocal->IsProjected() || poLocal->IsCompound());
    EXPECT_EQ(utils::CreateCRSTransform(poLocal.get(), poWgs84.get(), 0.0), nullptr);
    EXPECT_EQ(utils::CreateCRSTransform(poWgs84.get(), poLocal.get(), 0.0), nullptr);
    EXPECT_EQ(utils::CreateCRSTransform(nullptr, poWgs84.get(), 0.0), nullptr);
    EXPECT_EQ(utils::CreateCRSTransform(poWgs84.get(), nullptr, 0.0), nullptr);
    ExpectParameterError([&] { utils::CreateCompoundCS(nullptr, CS_VD_Orthometric); },
                         "poHorizontal", "");
    ExpectParameterError([&] { utils::CreateCompoundCS(poLocal.get(), CS_VD_Orthometric); },
                         "poHorizontal", "Local grid");
    ExpectParameterError(
        [&] { utils::CreateCompoundCS(poUtm.get(), nova::ogc::cs::CS_VD_AltitudeBarometric); },
        "eVertical", "2003");
    ExpectParameterError(
        [&] { utils::CreateCompoundCS(poUtm.get(), static_cast<nova::ogc::cs::DatumType>(7)); },
        "eVertical", "7");
    ExpectParameterError([&] { utils::CreateCRSTransform(poUtm.get(), poUtm.get(), -1.0); },
                         "dfAccuracy", "-1");

    // Points a transformation cannot take: failure, outputs untouched.
    MathTransformPtr poGeoid =
        Transform(Compound(CRSFromGeosys("LONG/LAT D000"), CS_VD_Orthometric), poWgs84);
    MathTransformPtr poFromUtm = Transform(Compound(poUtm, CS_VD_Ellipsoidal), poWgs84);
    ASSERT_TRUE(poGeoid && poFromUtm);
    const double dfNaN = std::nan("");
    const double dfInf = std::numeric_limits<double>::infinity();
    const std::pair<const MathTransformPtr*, Point> aBad[] = {{&poGeoid, {dfNaN, 10.0, 0.0}},
                                                              {&poGeoid, {10.0, dfInf, 0.0}},
                                                              {&poGeoid, {10.0, 10.0, dfNaN}},
                                                              {&poGeoid, {10.0, 95.0, 0.0}},
                                                              {&poFromUtm, {1e30, 1e30, 0.0}}};
    for (const auto& [poTransform, s] : aBad) {
        Point sOut{-7.0, -8.0, -9.0};
        EXPECT_FALSE(
            (*poTransform)->TransformPoint(s.dfX, s.dfY, s.dfZ, sOut.dfX, sOut.dfY, sOut.dfZ))
            << s.dfX << " " << s.dfY << " " << s.dfZ;
        EXPECT_TRUE(sOut.dfX == -7.0 && sOut.dfY == -8.0 && sOut.dfZ == -9.0);
    }
}

TEST(CRS, ConcurrentTransforms) {
    CRSPtr poShared = Compound(CRSFromGeosys("UTM 31 D000"), CS_VD_Orthometric);
    CRSPtr poWgs84 = WGS84Ellipsoidal();
    MathTransformPtr poOneTransform = Transform(poShared, poWgs84);
    ASSERT_TRUE(poOneTransform);
    // 400 points through a transformation, starting at point nFirst so that
    // concurrent calls interleave; the results in point order (NaN if failed).
    auto Run = [](const nova::ogc::ct::IMathTransform* poTransform, int nFirst) {
        std::vector<double> adf(3 * 400, std::nan(""));
        for (int k = 0; k < 400; ++k) {
            const int i = (k + nFirst) % 400;
            double x = 400000.0 + 500.0 * i, y = 5000000.0 + 3000.0 * i, z = 10.0 * (i % 17);
            if (poTransform && poTransform->TransformPoint(x, y, z, x, y, z)) {
                adf[3 * i] = x;
                adf[3 * i + 1] = y;
                adf[3 * i + 2] = z;
            }
        }
        return adf;
    };
    const std::vector<double> adfExpected = Run(poOneTransform.get(), 0);
    // Even threads make their own transformation from the one shared system,
    // odd ones share one transformation.
    std::vector<std::vector<double>> aadfResults(4);
    std::vector<std::thread> aoThreads;
    for (int t = 0; t < 4; ++t) {
        aoThreads.emplace_back([&, t] {
            MathTransformPtr poOwn(
                t % 2 ? nullptr : utils::CreateCRSTransform(poShared.get(), poWgs84.get(), 0.0));
            aadfResults[t] = Run(t % 2 ? poOneTransform.get() : poOwn.get(), 100 * t);
        });
    }
    for (auto& o : aoThreads) o.join();
    for (const auto& adf : aadfResults) EXPECT_EQ(adf, adfExpected);
}

}  // namespace
