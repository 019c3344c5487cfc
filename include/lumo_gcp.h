// Control point datum conversion: ground coordinates of control points from
// any projection and height reference to WGS 84 longitude, latitude and
// ellipsoidal height.
#pragma once

#include <string>
#include <vector>

#include "lumo_types.h"

// Rewrites the ground coordinates of every point in place, from the
// projection sProj to longitude and latitude (degrees) and height above the
// WGS 84 ellipsoid (metres). osHeightRef "M" (exactly) means the heights are
// above mean sea level (EGM96 geoid); any other value means ellipsoidal
// heights. Image coordinates are left unchanged.
//
// Throws nova::Exception "Could not transform GCPs to WGS84 Ellipsoidal" when
// no transformation exists (for instance when the geoid model is not
// installed), nova::ParameterException naming the projection when sProj has
// no coordinate reference system ("PIXEL", an unknown projection), and
// nova::DataException naming the point when one point cannot be transformed
// (non-finite or out-of-domain coordinates). On every failure the points are
// left exactly as they were.
LUMO_API void ConvertGcpsToWgs84Ell(const ProjInfo_t& sProj, std::string osHeightRef,
                                    std::vector<ControlPoint_t>& aoGcps);
