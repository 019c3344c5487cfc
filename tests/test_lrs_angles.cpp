// Sun and satellite angles of the orbit model: the sun against ERFA's
// ephemeris, the satellite's direction against the local horizon frame, and
// the angle grids with their interpolation and encoding.
#include <gtest/gtest.h>

#include <erfa.h>
#include <erfam.h>

#include <cmath>
#include <random>

#include "avhrr_sim.h"
#include "lumo.h"
#include "runtime.h"
#include "support/avhrr_pass.h"

namespace {

constexpr double kDeg = 3.141592653589793 / 180.0;

using Pass = lumo::support::AvhrrPass;

// Unit vector of a direction given by zenith and azimuth (degrees) in the
// local east-north-up frame.
void LocalDirection(double dfZenith, double dfAzimuth, double* v) {
    v[0] = std::sin(dfZenith * kDeg) * std::sin(dfAzimuth * kDeg);
    v[1] = std::sin(dfZenith * kDeg) * std::cos(dfAzimuth * kDeg);
    v[2] = std::cos(dfZenith * kDeg);
}

// East, north and up components of an Earth-fixed vector at (lon, lat).
void ToLocal(const double* w, double dfLon, double dfLat, double* v) {
    const double sl = std::sin(dfLon * kDeg), cl = std::cos(dfLon * kDeg);
    const double sp = std::sin(dfLat * kDeg), cp = std::cos(dfLat * kDeg);
    v[0] = -sl * w[0] + cl * w[1];
    v[1] = -sp * cl * w[0] - sp * sl * w[1] + cp * w[2];
    v[2] = cp * cl * w[0] + cp * sl * w[1] + sp * w[2];
}

// The sun's apparent direction in the local frame from ERFA: the Earth's
// heliocentric position, annual aberration, and the celestial-to-terrestrial
// rotation (UT1 taken as UTC, no polar motion).
void ErfaSun(double dfUtc1, double dfUtc2, double dfLon, double dfLat, double* v) {
    double tai1, tai2, tt1, tt2, pvh[2][3], pvb[2][3], rc2t[3][3];
    eraUtctai(dfUtc1, dfUtc2, &tai1, &tai2);
    eraTaitt(tai1, tai2, &tt1, &tt2);
    eraEpv00(tt1, tt2, pvh, pvb);
    double sun[3] = {-pvh[0][0], -pvh[0][1], -pvh[0][2]}, dir[3], app[3];
    const double dist = eraPm(sun);
    eraSxp(1.0 / dist, sun, dir);
    double vel[3];
    eraSxp(ERFA_AULT / ERFA_DAYSEC, pvb[1], vel);
    eraAb(dir, vel, dist, std::sqrt(1.0 - eraPm(vel) * eraPm(vel)), app);
    eraC2t06a(tt1, tt2, dfUtc1, dfUtc2, 0.0, 0.0, rc2t);
    double itrs[3];
    eraRxp(rc2t, app, itrs);
    ToLocal(itrs, dfLon, dfLat, v);
}

TEST(OrbitAngles, SunMatchesAPreciseEphemeris1990To2040) {
    Pass pass;
    LRSOrbitModel_t& m = pass.oModel;
    const double dfPixel = 1024.0, dfLine = 100.0;
    double t = 0.0, look[3];
    ImageToSensor(&m.sSensor, dfLine, dfPixel, &t, look);
    std::mt19937 oRandom(11);
    std::uniform_real_distribution<double> oUnit(0.0, 1.0);
    double dfWorst = 0.0;
    for (int k = 0; k < 1500; ++k) {
        const int nYear = 1990 + static_cast<int>(oUnit(oRandom) * 51) % 51;
        const double dfSecOfYear = oUnit(oRandom) * 365.0 * 86400.0;
        const double dfLon = -180.0 + 360.0 * oUnit(oRandom);
        const double dfLat = -90.0 + 180.0 * oUnit(oRandom);
        m.nEpochYear = nYear;
        m.dfEpochSecOfYear = dfSecOfYear - t - m.dfTimeOrigin;
        double satZ, satA, sunZ, sunA, rel;
        LRSComputeAngles(&m, dfPixel, dfLine, dfLon, dfLat, &satZ, &satA, &sunZ, &sunA, &rel);
        double jd0, mjd;
        eraCal2jd(nYear, 1, 1, &jd0, &mjd);
        double ours[3], ref[3];
        LocalDirection(sunZ, sunA, ours);
        ErfaSun(jd0 + mjd, dfSecOfYear / 86400.0, dfLon, dfLat, ref);
        dfWorst = std::max(dfWorst, std::acos(std::min(1.0, eraPdp(ours, ref))) / kDeg);
    }
    EXPECT_LT(dfWorst, 0.02);
    // Defined at the poles and with the sun overhead.
    for (double dfLat : {90.0, -90.0}) {
        double satZ, satA, sunZ, sunA, rel;
        LRSComputeAngles(&m, dfPixel, dfLine, 10.0, dfLat, &satZ, &satA, &sunZ, &sunA, &rel);
        EXPECT_TRUE(std::isfinite(sunA) && std::isfinite(rel) && std::isfinite(satA));
    }
}

// The satellite's zenith and true azimuth seen from the ground point of
// each pixel, against the direction to the satellite in the local frame, for
// descending and ascending passes stored either way; the right half of the
// scan comes encoded.
TEST(OrbitAngles, SatelliteDirectionFollowsTheGeometry) {
    lumo::sim::AvhrrPassSpec sAscending, sBackward;
    sAscending.dfMeanAnomaly = 300.0;  // northwards over the Pacific
    sBackward.bBackward = true;
    for (const auto& s : {lumo::sim::AvhrrPassSpec(), sAscending, sBackward}) {
        Pass pass(s);
        double dfWorst = 0.0;
        for (double p : {0.5, 300.0, 1023.0, 1100.0, 1800.0, 2047.5}) {
            const double l = 700.0;
            double G[3], S[3], lon, lat;
            ASSERT_EQ(ImageToEcr(&pass.oModel, p, l, G), 1);
            EcrToGeodetic(G, &lon, &lat);
            LRSSatelliteXYZ(&pass.oModel, p, l, S);
            double d[3], v[3];
            VecDiff(S, G, d);
            VecNormalize(d);
            ToLocal(d, lon, lat, v);
            double satZ, satA, sunZ, sunA, rel;
            LRSComputeAngles(&pass.oModel, p, l, lon, lat, &satZ, &satA, &sunZ, &sunA, &rel);
            if (p >= 1024.0) {
                satA = LRSDecodeSatAzimuthAngle(satA);
                rel = LRSDecodeRelativeAzimuthAngle(rel);
            }
            EXPECT_NEAR(satZ, std::acos(v[2]) / kDeg, 1e-6);
            double ours[3];
            LocalDirection(satZ, satA, ours);
            dfWorst = std::max(dfWorst, std::acos(std::min(1.0, DotProduct(ours, v))) / kDeg);
            EXPECT_NEAR(std::fmod(satA - sunA + 720.0, 360.0), rel, 1e-9);
        }
        EXPECT_LT(dfWorst, 0.05);
    }
}

TEST(OrbitAngles, GridsInterpolateAndEncode) {
    lumo::sim::AvhrrPassSpec s;
    s.nLines = 611;  // (611 - 1) mod 20 = 10: a short last row
    Pass pass(s);
    LRSOrbitModel_t& m = pass.oModel;
    LRSSetupOrbitModelForAngleGeneration(&m);
    LRSSetupOrbitModelForAngleGeneration(&m);  // again: the first grids go
    EXPECT_EQ(m.nGridCols, 104);
    EXPECT_EQ(m.nGridRows, 32);
    double a[5], b[5], exact[5];
    auto Interpolated = [&m](double p, double l, double* out, int nDecode) {
        LRSComputeInterpolatedAngles(&m, p, l, out, out + 1, out + 2, out + 3, out + 4, nDecode,
                                     nullptr, nullptr);
    };
    // The angles computed at the ground point of (p, l).
    auto Exact = [&m](double p, double l, double* out) {
        double G[3], lon, lat;
        ImageToEcr(&m, p, l, G);
        EcrToGeodetic(G, &lon, &lat);
        LRSComputeAngles(&m, p, l, lon, lat, out, out + 1, out + 2, out + 3, out + 4);
    };
    // A node gives the exact angles; the last pixel and line their nodes.
    for (const auto& [p, l] : {std::pair<double, double>{40.5, 100.5}, {1200.5, 600.5}}) {
        Interpolated(p, l, a, 0);
        Exact(p, l, exact);
        for (int k = 0; k < 5; ++k) EXPECT_NEAR(a[k], exact[k], 1e-9) << k;
    }
    Interpolated(2047.0, 610.0, a, 0);
    EXPECT_EQ(a[0], m.apadfAngleGrids[0][32 * 104 - 1]);
    // Pixel and line are truncated first; decoding undoes the right half's
    // encoding; a scale and offset apply only when both are given.
    Interpolated(1500.2, 300.1, a, 0);
    Interpolated(1500.9, 300.8, b, 1);
    EXPECT_EQ(a[0], b[0]);
    EXPECT_DOUBLE_EQ(LRSDecodeSatAzimuthAngle(a[1]), b[1]);
    double adfScale[5] = {2, 2, 2, 2, 2}, adfOffset[5] = {1, 1, 1, 1, 1}, dfSunZ = 0.0;
    LRSComputeInterpolatedAngles(&m, 1500.0, 300.0, nullptr, nullptr, &dfSunZ, nullptr, nullptr, 0,
                                 adfScale, adfOffset);
    EXPECT_DOUBLE_EQ(dfSunZ, 2.0 * a[2] + 1.0);
    LRSComputeInterpolatedAngles(&m, 1500.0, 300.0, nullptr, nullptr, &dfSunZ, nullptr, nullptr, 0,
                                 adfScale, nullptr);
    EXPECT_EQ(dfSunZ, a[2]);
    EXPECT_EQ(LRSEncodeSatAzimuthAngle(180.0), 0.0);
    EXPECT_EQ(LRSDecodeSatAzimuthAngle(180.0), 360.0);
    EXPECT_EQ(LRSEncodeRelativeAzimuthAngle(-540.0), 0.0);
    // Interpolation error over the image, against the exact angles.
    double dfWorst[5] = {0, 0, 0, 0, 0};
    for (double p = 3.5; p < 2048.0; p += 37.0) {
        for (double l = 2.5; l < 611.0; l += 29.0) {
            Interpolated(p, l, a, 0);
            Exact(p, l, exact);
            for (int k = 0; k < 5; ++k) {
                const double d = std::fabs(std::remainder(a[k] - exact[k], 360.0));
                dfWorst[k] = std::max(dfWorst[k], d);
            }
        }
    }
    EXPECT_LT(dfWorst[0], 0.1);
    EXPECT_LT(dfWorst[2], 0.01);
    // Bad input.
    EXPECT_THROW(Interpolated(NAN, 3.0, a, 0), nova::NumberedError);
    LRSDeleteOrbitModel(&m);
    EXPECT_THROW(Interpolated(1.0, 3.0, a, 0), nova::NumberedError);
    EXPECT_THROW(LRSComputeAngles(&m, 1.0, 1.0, 0.0, 91.0, a, a, a, a, a), nova::NumberedError);
}

}  // namespace
