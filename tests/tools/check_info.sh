#!/usr/bin/env bash
# Runs `kelvane info --json` and `kelvane info --tree --json` on the sample
# and every fixture, and compares them with what mkvinfo reported for the
# same files (NAME.expected and NAME.tree, written when the files were made):
# the Segment Info, each track's number, UID, codec, name, languages and
# flags, the tags with their targets, the chapters, the attachments, and
# every element's depth, offset and sizes (mkvinfo lists no CRC-32 element).
# On a damaged fixture the tree stops where the damage starts (exit code 1)
# and agrees with mkvinfo's up to there.
#   check_info.sh SOURCE_DIR [EMULATOR ARGS...] KELVANE
source "$(dirname "${BASH_SOURCE[0]}")/check_common.sh" "$@"

args=()
for expected in "$source_dir/samples/sample.expected" "$fixtures"/*.expected; do
  mkv=${expected%.expected}.mkv name=$(basename "$mkv" .mkv)
  "${kelvane[@]}" info --json "$mkv" >"$work/$name.json" || fail "$name: kelvane info exited $?"
  "${kelvane[@]}" info --tree --json "$mkv" >"$work/$name.tree.json" 2>/dev/null
  code=$? want=$(grep -c '^damaged_at ' "$expected")
  ((code == want)) || fail "$name: kelvane info --tree exited $code, not $want"
  args+=("$expected" "$work/$name.json" "$work/$name.tree.json")
done
python3 - "${args[@]}" <<'PY' || failures=$((failures + 1))
import json, os, sys
bad = 0
def same(name, what, want, got):
    global bad
    if want != got:
        print("FAIL %s: %s: mkvinfo %r, kelvane %r" % (name, what, want, got)); bad += 1
for expected, info_path, tree_path in zip(*[iter(sys.argv[1:])] * 3):
    name = os.path.basename(expected)
    lines = [l.rstrip("\n").split(" ", 1) for l in open(expected, encoding="utf-8") if not l.startswith("#")]
    value = lambda key: next((v for k, v in lines if k == key), None)
    info, tree = json.load(open(info_path)), json.load(open(tree_path))
    seg = info["segment_info"]
    for key, got in [("doc_type", info["ebml_header"]["doc_type"]), ("timecode_scale", str(seg["timecode_scale_ns"])),
                     ("duration_ns", seg["duration_ns"] and str(seg["duration_ns"])), ("title", seg["title"]),
                     ("muxing_app", seg["muxing_app"]), ("writing_app", seg["writing_app"])]:
        same(name, key, value(key), got)
    names = dict(v.split(" ", 1) for k, v in lines if k == "track_name")
    tracks = [dict(f.split("=", 1) for f in v.split(" ")) for k, v in lines if k == "track"]
    want = [(t["number"], t["uid"], t["codec"], names.get(t["number"]), t.get("language", "eng"),
             t.get("language_ietf"), t.get("flag_default", "1"), t.get("flag_enabled", "1"),
             t.get("flag_forced", "0")) for t in tracks]
    same(name, "tracks", want, [(str(t["number"]), str(t["uid"]), t["codec_id"], t["name"], t["language"], t["language_ietf"],
         str(int(t["flag_default"])), str(int(t["flag_enabled"])), str(int(t["flag_forced"]))) for t in info["tracks"]])
    want, target = [], None
    for k, v in lines:
        if k == "tag_target": target = v.strip()
        if k == "tag": want.append((target,) + tuple((v.split(" ", 1) + [""])[:2]))
    got = []
    for tag in info["tags"]:
        t = tag["target"]
        uids = ",".join("%s:%d" % (kind, uid) for kind in ("track", "edition", "chapter", "attachment") for uid in t[kind + "_uids"])
        got.append((("%d %s" % (t["type_value"], uids)).strip(), tag["name"], tag["value"] or ""))
    same(name, "tags and targets", want, got)
    got = []
    def chapters(list, depth):
        for c in list:
            got.append("chapter %d %d %d %s" % (depth, c["uid"], c["start_ns"], "-" if c["end_ns"] is None else c["end_ns"]))
            got.extend("chapter_name %s %s %s" % (n["languages"][0], (n["languages_ietf"] or ["-"])[0], n["name"]) for n in c["names"])
            chapters(c["chapters"], depth + 1)
    for e in info["editions"]:
        got.append("edition %d" % e["uid"]); chapters(e["chapters"], 0)
    same(name, "chapters", [k + " " + v for k, v in lines if k in ("edition", "chapter", "chapter_name")], got)
    same(name, "attachments", [v for k, v in lines if k == "attachment"],
         ["%d %d %s %s" % (a["uid"], a["size"], a["mime_type"], a["file_name"]) for a in info["attachments"]])
    want = open(expected[:-len(".expected")] + ".tree").read().split("\n")[:-1]
    got = ["%d %d %d %d" % (e["depth"], e["offset"], e["header_size"] + e["data_size"], e["data_size"])
           for e in tree["elements"] if e["id"] != "0xBF"]
    if not tree["complete"]:
        same(name, "a tree that stops", True, value("damaged_at") is not None)
        damaged = [int(r.split()[1]) for r in want if int(r.split()[1]) <= int(value("damaged_at") or 0)]
        same(name, "a stop not before the damaged element", True, tree["stopped_at"] >= max(damaged or [0]))
        before = lambda rows: [r for r in rows if int(r.split()[1]) < tree["stopped_at"]]
        want, got = before(want), before(got)
    same(name, "element tree", want, got)
sys.exit(bad > 0)
PY

# A damaged file lists what it could read.
head -c 6000 "$fixtures/avc_aac.mkv" >"$work/cut.mkv"
out=$("${kelvane[@]}" info --tree "$work/cut.mkv" 2>/dev/null)
[[ $? == 1 && $out == *"stopped at byte 5610: the file ends inside SimpleBlock at 5610"* ]] || fail "a cut file's tree: $(tail -1 <<<"$out")"
finish "kelvane info agrees with mkvinfo on every fixture"
