# bash completion for fennick

# Prints what may stand for a datatype, one a line. It is the hub's own, from
# the overview of the program $1, where "  camera_vsync.1.2" stands for
# camera_vsync, camera_vsync.1 and camera_vsync.2.
_fennick_datatypes() {
  local line datatype index indices
  while IFS= read -r line; do
    [[ $line == '  '* ]] || continue
    IFS=. read -r datatype indices <<<"${line#  }"
    printf '%s\n' "$datatype"
    while [[ $indices ]]; do
      IFS=. read -r index indices <<<"$indices"
      printf '%s.%s\n' "$datatype" "$index"
    done
  done < <("${1/#\~\//$HOME/}" list 2>/dev/null)
}

# Completes $2, which is empty behind the "=" of a long option, for the
# program $1.
_fennick() {
  local mode=stream value_of='' word candidate
  for word in "${COMP_WORDS[@]:1:COMP_CWORD-1}"; do
    if [[ $value_of ]]; then
      [[ $word == '=' ]] || value_of=''
    elif [[ $word == list ]]; then
      mode=list
    elif [[ $word =~ ^-[cdhops]*([anrtv])$ ]]; then
      value_of=${BASH_REMATCH[1]}
    else
      case $word in  # getopt_long takes abbreviations
        *=*) ;;
        --a*) value_of=a ;;
        --c*) value_of=n ;;
        --r*) value_of=r ;;
        --t*) value_of=t ;;
        --verb*) value_of=v ;;
      esac
    fi
  done

  COMPREPLY=()
  while IFS= read -r candidate; do
    [[ $candidate != "$2"* ]] || COMPREPLY+=("$candidate")
  done < <(
    if [[ $value_of == a ]]; then
      printf '%s\n' {0..3}
    elif [[ $value_of == v ]]; then
      printf '%s\n' {1..4}
    elif [[ $value_of ]]; then
      :
    elif [[ $2 == -* ]]; then
      printf -- '%s\n' -{c,h,o,s,v} \
        --{help,on-change,one-shot,streaming,verbose,version}
      [[ $mode == list ]] || printf -- '%s\n' -{a,d,n,p,r,t} \
        --{accuracy,count,diff,passive,rate,time}
    else
      [[ $mode == list ]] || echo list
      _fennick_datatypes "$1"
    fi
  )
}

complete -F _fennick fennick
