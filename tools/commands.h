#pragma once
// The kelvane tool's commands. Each takes the arguments after its name and
// answers the process exit code: 0 ok, 1 the file was refused or failed, 2 usage.

int RunExtract(int argc, char** argv);
int RunInfo(int argc, char** argv);
int RunMetadata(int argc, char** argv);
int RunPackets(int argc, char** argv);
int RunProbe(int argc, char** argv);
