// Faults on demand at the named steps of the package manager's roads, so that tests can
// prove what a crash, a refusal or a full volume at any step leaves behind.
//
// Compiled in only when the build asks for it (CORVPKG_FAULT_INJECTION, on in builds with
// the test suite); otherwise CORVFaultAt does nothing and returns false. The requests come
// from the environment of the process that runs the road:
//   CORVPKG_FAULT="<road>:<step>:<action>" where <action> is
//     kill  the process ends with SIGKILL on entering the step;
//     fail  the step fails without running;
//     fill  the file system of CORVPKG_FAULT_FILL (default /volume1) is filled up to the
//           last byte with the file ".fault-fill" there, and the step runs on a full volume.
//   CORVPKG_FAULT_TRACE=<file> appends "<road>:<step>\t<free bytes>" to <file> for every
//   step entered, the free bytes being those of the file system that "fill" fills, so that
//   a test learns the steps of a road, and which of them take or give back room, from the
//   road itself.
//   CORVPKG_FAULT_SECONDS="<name>=<seconds>" shortens the wait of that name, so that a test
//   of a bound or of a paced retry need not sit through it.
#pragma once

// Called on entering each named step. True when the step is to fail (logged).
bool CORVFaultAt(const char* road, const char* step);

// The seconds of the wait `name`: `seconds`, unless a test build was asked for others.
int CORVFaultSeconds(const char* name, int seconds);

// The name of the filler file that the "fill" action writes.
#define CORV_FAULT_FILL_FILE ".fault-fill"
