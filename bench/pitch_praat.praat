# Pitch track of every sound file named in a list file (one path a line),
# autocorrelation method with Praat's standard settings and the given range.
# For X.wav it writes X.praat.txt: line 1 the centre time of the first frame
# in seconds, line 2 one value per frame in Hz, 0 where Praat finds no voice.
# Frames follow at the given time step.
form Pitch tracks
  sentence list_file
  positive time_step_s 0.01
  positive floor_hz 75
  positive ceiling_hz 500
endform

list = Read Strings from raw text file: list_file$
n = Get number of strings
for i to n
  selectObject: list
  wav$ = Get string: i
  sound = Read from file: wav$
  pitch = To Pitch (ac): time_step_s, floor_hz, 15, "no", 0.03, 0.45, 0.01, 0.35, 0.14, ceiling_hz
  first_frame_s = Get time from frame number: 1
  matrix = To Matrix
  f0_hz## = Get all values
  out$ = wav$ - ".wav" + ".praat.txt"
  writeFileLine: out$, fixed$ (first_frame_s, 6)
  appendFileLine: out$, f0_hz##
  removeObject: sound, pitch, matrix
endfor
removeObject: list
