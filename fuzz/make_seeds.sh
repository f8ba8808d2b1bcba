#!/usr/bin/env bash
# Seed corpora of the fuzz targets: small real ESA files from the sample archive (read in place,
# copied), small products of the simulator when the normal build has it, and a few hand-written
# texts. Nothing here is committed; the folder is rebuilt on every run.
#   make_seeds.sh SEED_DIR [NORMAL_BUILD_DIR]
set -euo pipefail
here="$(cd "$(dirname "${BASH_SOURCE[0]}")/.." && pwd)"
out="$1"
normal_build="${2:-$here/build}"
real="${SAR_REAL_DATA_DIR:-$here/../shared/data/real}"
rm -rf "$out"
mkdir -p "$out"/{level0_header,level0_walk,asa_ins,asa_xca,asa_xch,orbit_envisat,orbit_text,profile,job_list,configuration,xml_header,description,raster_header}

first() { ls "$1" 2>/dev/null | head -n "${2:-1}" | sed "s|^|$1/|"; }
if [ -d "$real" ]; then
  for f in "$real"/ASA_IM__0P_truncated/* "$real"/ASA_IMS_1P_truncated/*; do
    cp "$f" "$out/level0_header/"; cp "$f" "$out/level0_walk/"
  done
  for f in $(first "$real/ASA_INS_AX" 2); do cp "$f" "$out/asa_ins/"; done
  for f in $(first "$real/ASA_XCA_AX" 2); do cp "$f" "$out/asa_xca/"; done
  for f in $(first "$real/ASA_XCH_AX" 1); do cp "$f" "$out/asa_xch/"; done
  # The other auxiliary types are good seeds of the type checks.
  cp "$(first "$real/ASA_CON_AX")" "$out/asa_xch/"
  for f in "$real"/DOR_VOR_AX/* "$real"/DOR_POR_AX/*; do cp "$f" "$out/orbit_envisat/"; done
fi

# Simulated level 0 products of each mode, kept small (lines and samples), and their orbits.
sarsim="$normal_build/tools/sarsim"
if [ -x "$sarsim" ]; then
  sim="$out/.sim"
  for mode in im apc ws; do
    lines=300
    [ "$mode" = ws ] && lines=900
    if "$sarsim" --out "$sim/$mode" --mode "$mode" --lines "$lines" --samples 120 --no-aux >/dev/null 2>&1; then
      for f in "$sim/$mode"/*.N1; do cp "$f" "$out/level0_walk/sim_$mode.N1"; cp "$f" "$out/level0_header/sim_$mode.N1"; done
      for f in "$sim/$mode"/*_AX*; do [ -f "$f" ] && cp "$f" "$out/orbit_envisat/sim_$(basename "$f")"; done
    fi
  done
  "$sarsim" --out "$sim/faults" --lines 300 --samples 120 --no-aux --fault lost --fault corrupt-header \
    --fault seq-wrap >/dev/null 2>&1 && for f in "$sim/faults"/*.N1; do cp "$f" "$out/level0_walk/sim_faults.N1"; done
  rm -rf "$sim"
else
  echo "make_seeds: no simulator at $sarsim, level 0 seeds are the real samples only" >&2
fi

cp "$here"/data/parameters_*.hdr "$here/data/ASA_AUX_list.dat" "$out/profile/"
printf '[AzimuthConf]\nDCpoly = 1 2 3 4 5 6 7 8 9\nMatrix = 1 2 3 4\n\t{5 6 7 8\n\t{9 10 11 12\n[ASA_INS_0]\nNames = "a" "b"\n\t{"c" "d"\n' \
  >"$out/profile/matrix.hdr"
cp "$here/data/Vanterra_configuration.ini.template" "$here"/data/vtr_*_catalog.des "$out/configuration/"
printf 'main_focussing_asar_IM#\n/data/ASA_IM__0.N1\nNotOK\r\n  OK  \n\n# end\nignored\n' >"$out/job_list/im.lst"

cat >"$out/orbit_text/radarsat.txt" <<'TXT'
; generated
GENERATION TIME: 2008-061 00:00:00
ORBIT NUMBER: 31388
GREENWICH ANGLE: 0.500000000000
1ST MODEL: none
2ND MODEL: none
2008 100 10 00 00 000
-1441522.1234 -4913102.9876 4822012.5555
5012.1234567 -3021.7654321 -4210.1111111
2008 100 10 01 00 000
-1132522.1234 -5093102.9876 4562012.5555
5122.1234567 -2981.7654321 -4390.1111111
2008 100 10 02 00 000
-823522.1234 -5253102.9876 4292012.5555
5222.1234567 -2931.7654321 -4560.1111111
2008 100 10 03 00 000
-511522.1234 -5393102.9876 4012012.5555
5302.1234567 -2871.7654321 -4720.1111111
2008 100 10 04 00 000
-199522.1234 -5513102.9876 3722012.5555
5362.1234567 -2801.7654321 -4870.1111111
TXT

cat >"$out/xml_header/header.xml" <<'XML'
<?xml version="1.0"?>
<OmbrixXmlDoc>
  <NumberOfChannels>2</NumberOfChannels>
  <Description>seed</Description>
  <Channel Number="1">
    <RasterInfo><CellType>3</CellType><NumberOfLines>100</NumberOfLines><Dummy>0,1</Dummy>
      <FileName><val N="1">a</val><val N="2">b</val></FileName></RasterInfo>
    <PolySAR><NDC>2</NDC><NFR>1</NFR><NSL2GR>0</NSL2GR><NGR2SL>0</NGR2SL><NSL2THETA>0</NSL2THETA><NSL2PHI>0</NSL2PHI>
      <DCpoly-0><Coefficients>1,2,3,4,5,6,7,8,9</Coefficients></DCpoly-0></PolySAR>
  </Channel>
  <Channel Number="2"><RasterInfo><CellType>0</CellType></RasterInfo></Channel>
</OmbrixXmlDoc>
XML
printf '[PolySAR]\nNDC = 1\nNFR = 1\n[DCpoly-0]\nDCpoly = 1 2 3 4 5 6 7 8 9\n' >"$out/xml_header/profile.hdr"

# Description seeds: first byte 0 XML, 1 profile text, 2 key table.
{ printf '\0'; cat <<'XML'
<?xml version="1.0" ?>
<HEADER_INFO xmlns="http://www.example.org/seed">
   <RasterInfo>
      <HeaderOffset>0</HeaderOffset>
      <RowPrefix>IS_EMPTY</RowPrefix>
      <CellType>FLOAT_COMPLEX</CellType>
      <NullCellValue>NaN</NullCellValue>
      <NrOfPixelsPerLine>120</NrOfPixelsPerLine>
      <NrOfLinesPerImage>300</NrOfLinesPerImage>
      <OtherInfo>
         <MatrixString NumberOfRows = "2" NumberOfColumns = "2">
            <MatrixRow>
               <ValueString>a &amp; b</ValueString>
               <ValueString><![CDATA[c]]></ValueString>
            </MatrixRow>
            <MatrixRow>
               <ValueString>d</ValueString>
               <ValueString>e</ValueString>
            </MatrixRow>
         </MatrixString>
      </OtherInfo>
   </RasterInfo>
   <ChannelInfo>
      <PRF>
         <VectorDouble NumberOfElements = "2">
            <ValueDouble ID = "1">1652.4</ValueDouble>
            <ValueDouble ID = "2">1652.5</ValueDouble>
         </VectorDouble>
      </PRF>
   </ChannelInfo>
   <!-- comment -->
</HEADER_INFO>
XML
} >"$out/description/product.sml"
{ printf '\1'; printf '[RasterInfo]\nHeaderOffset = 0\nCellType = FLOAT_COMPLEX\nNrOfPixelsPerLine = 120\nNrOfLinesPerImage = 300\nOtherInfo = "a" "b"\n\t{"c" "d"\n[ChannelInfo]\nPRF = 1652.4 1652.5\n'; } \
  >"$out/description/product_hdr"
{ printf '\2'; printf 'A = SCALAR(Integer)\nB = VECTOR(Double)\nC = MATRIX(String)\nD = MULTIPLE(X Integer, Y EFDT)\n'; } \
  >"$out/description/keys.txt"

printf '[RasterInfo]\nNrOfLinesPerImage = 16\nNrOfPixelsPerLine = 32\nHeaderOffset = 0\nRowPrefix = 0\nByteOrder = LSBFirst\nCellType = FLOAT_COMPLEX\n' \
  >"$out/raster_header/profile.hdr"
cat >"$out/raster_header/xml.hdr" <<'XML'
<?xml version="1.0"?>
<OmbrixXmlDoc>
  <NumberOfChannels>1</NumberOfChannels>
  <Description>raster</Description>
  <Channel Number="1">
    <RasterInfo><NrOfLinesPerImage>16</NrOfLinesPerImage><NrOfPixelsPerLine>32</NrOfPixelsPerLine>
      <HeaderOffset>8</HeaderOffset><RowPrefix>4</RowPrefix><ByteOrder>1</ByteOrder><CellType>3</CellType></RasterInfo>
  </Channel>
</OmbrixXmlDoc>
XML
